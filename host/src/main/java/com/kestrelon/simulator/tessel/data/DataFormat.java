package com.kestrelon.simulator.tessel.data;

import java.util.List;
import java.util.regex.Pattern;

/**
 * The two data file formats, told apart by the first line that carries data: a line starting
 * with a digit or dot whose first '|' comes before any '=' is snmprec, {@code OID = ...} is
 * snmpwalk output.
 */
enum DataFormat {
    SNMPREC,
    SNMPWALK;

    private static final Pattern SNMPREC_LINE = Pattern.compile("[.0-9][^=|]*\\|.*");
    private static final Pattern SNMPWALK_LINE = Pattern.compile("\\s*\\.?[0-9]+(\\.[0-9]+)*\\s*=.*");

    static DataFormat detect(String source, List<String> lines) throws DeviceDataException {
        for (int i = 0; i < lines.size(); i++) {
            String line = lines.get(i);
            if (line.isBlank() || line.startsWith("#")) {
                continue;
            }
            if (SNMPREC_LINE.matcher(line).matches()) {
                return SNMPREC;
            }
            if (SNMPWALK_LINE.matcher(line).matches()) {
                return SNMPWALK;
            }
            if (SnmpwalkParser.isTrailer(line.trim())) {
                continue;
            }
            throw new DeviceDataException(source, i + 1,
                    "unknown format: expected 'OID|TAG|VALUE' (snmprec) or 'OID = TYPE: VALUE' (snmpwalk -On)");
        }
        throw new DeviceDataException(source, Math.max(1, lines.size()), "no objects in the data");
    }
}
