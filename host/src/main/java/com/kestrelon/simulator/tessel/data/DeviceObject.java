package com.kestrelon.simulator.tessel.data;

import java.util.Objects;

/**
 * One recorded object: its identifier, its type, its value as engine text (see {@link ValueText}
 * for the forms) and the line of the data file it came from. Immutable.
 */
public record DeviceObject(Oid oid, BerType type, String value, int line) {
    public DeviceObject {
        Objects.requireNonNull(oid, "oid");
        Objects.requireNonNull(type, "type");
        Objects.requireNonNull(value, "value");
    }

    /** The BER tag number of the type. */
    public int typeNumber() {
        return type.number();
    }
}
