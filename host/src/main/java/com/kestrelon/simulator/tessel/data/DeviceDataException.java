package com.kestrelon.simulator.tessel.data;

/**
 * A fault in a device data file. The message reads {@code FILE:LINE: reason}, where FILE is the
 * name the data was loaded under and LINE the 1-based line the fault is on.
 */
public final class DeviceDataException extends Exception {
    private static final long serialVersionUID = 1L;

    private final String file;
    private final int line;
    private final String reason;

    public DeviceDataException(String file, int line, String reason) {
        super(file + ":" + line + ": " + reason);
        this.file = file;
        this.line = line;
        this.reason = reason;
    }

    public String file() {
        return file;
    }

    public int line() {
        return line;
    }

    public String reason() {
        return reason;
    }
}
