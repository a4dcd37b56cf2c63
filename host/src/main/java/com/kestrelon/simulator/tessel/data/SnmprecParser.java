package com.kestrelon.simulator.tessel.data;

import java.nio.charset.StandardCharsets;
import java.util.ArrayList;
import java.util.List;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

/**
 * Reads {@code .snmprec} lines: {@code OID|TAG|VALUE}, split at the first two '|'. TAG is a BER
 * tag number, optionally followed by {@code x} when VALUE is hex-encoded. For the octet types hex
 * gives the octets, for IpAddress the 4 address octets, for the other types the hex decodes to
 * the value's usual text. Blank lines and lines starting with '#' are skipped.
 */
final class SnmprecParser {
    private static final Pattern TAG = Pattern.compile("([0-9]{1,3})(x?)");

    private SnmprecParser() {
    }

    static List<DeviceObject> parse(String source, List<String> lines) throws DeviceDataException {
        List<DeviceObject> objects = new ArrayList<>();
        for (int i = 0; i < lines.size(); i++) {
            String line = lines.get(i);
            if (line.isBlank() || line.startsWith("#")) {
                continue;
            }
            objects.add(parseLine(source, i + 1, line));
        }
        return objects;
    }

    private static DeviceObject parseLine(String source, int lineNo, String line) throws DeviceDataException {
        int bar1 = line.indexOf('|');
        int bar2 = bar1 < 0 ? -1 : line.indexOf('|', bar1 + 1);
        if (bar2 < 0) {
            throw new DeviceDataException(source, lineNo, "expected OID|TAG|VALUE");
        }
        String oidText = line.substring(0, bar1);
        String tag = line.substring(bar1 + 1, bar2);
        String value = line.substring(bar2 + 1);
        Oid oid;
        try {
            oid = Oid.parse(oidText.trim());
        } catch (IllegalArgumentException e) {
            throw new DeviceDataException(source, lineNo, "bad OID '" + oidText + "': " + e.getMessage());
        }
        if (tag.contains(":")) {
            throw new DeviceDataException(source, lineNo, "variation modules are not supported (tag '" + tag + "')");
        }
        Matcher tagMatch = TAG.matcher(tag);
        BerType type = tagMatch.matches() ? BerType.fromNumber(Integer.parseInt(tagMatch.group(1))) : null;
        if (type == null) {
            throw new DeviceDataException(source, lineNo, "unknown tag '" + tag + "'");
        }
        try {
            return new DeviceObject(oid, type, valueText(type, !tagMatch.group(2).isEmpty(), value), lineNo);
        } catch (IllegalArgumentException e) {
            throw new DeviceDataException(source, lineNo,
                    "bad " + type + " value for " + oid + ": " + e.getMessage());
        }
    }

    private static String valueText(BerType type, boolean hex, String value) {
        if (type.isOctets()) {
            byte[] octets = hex ? ValueText.fromHex(value.trim()) : value.getBytes(StandardCharsets.ISO_8859_1);
            return ValueText.octetsText(octets);
        }
        if (type == BerType.IP_ADDRESS && hex) {
            byte[] octets = ValueText.fromHex(value.trim());
            if (octets.length != 4) {
                throw new IllegalArgumentException("an IpAddress has 4 octets");
            }
            return ValueText.ipText(octets);
        }
        String text = hex ? new String(ValueText.fromHex(value.trim()), StandardCharsets.ISO_8859_1) : value;
        return ValueText.canonical(type, text.trim());
    }
}
