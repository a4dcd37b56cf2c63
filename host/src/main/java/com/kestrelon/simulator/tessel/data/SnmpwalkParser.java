package com.kestrelon.simulator.tessel.data;

import java.math.BigInteger;
import java.nio.charset.StandardCharsets;
import java.util.ArrayList;
import java.util.List;
import java.util.Locale;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

/**
 * Reads {@code snmpwalk -On} output in net-snmp's default value format, one object per
 * {@code .OID = TYPE: value} line. Quoted strings may run over several lines (with {@code \"} and
 * {@code \\} escapes); Hex-STRING, OPAQUE, BITS and unquoted STRING values continue on the
 * following lines that are not object lines. Trailer texts ("No more variables left ...",
 * "End of MIB", "No Such Object/Instance ...") are skipped, with or without an OID before them;
 * a "Wrong Type (should be ...):" prefix is dropped and the value read by its actual type.
 */
final class SnmpwalkParser {
    private static final Pattern OBJECT_LINE = Pattern.compile("\\s*(\\.?[0-9]+(?:\\.[0-9]+)*)\\s*=\\s*(.*)");
    private static final Pattern WRONG_TYPE = Pattern.compile("Wrong Type \\(should be [^)]*\\):\\s*");
    private static final Pattern LEADING_SIGNED = Pattern.compile("(-?[0-9]+)(?:\\s.*)?");
    private static final Pattern ENUMERATION = Pattern.compile("[^()]*\\((-?[0-9]+)\\)\\s*");
    private static final Pattern LEADING_UNSIGNED = Pattern.compile("([0-9]+)(?:\\s.*)?");
    private static final Pattern TIMETICKS = Pattern.compile("\\(([0-9]+)\\).*");
    private static final Pattern HEX_OCTET = Pattern.compile("[0-9a-fA-F]{2}");

    /** The value kinds, by the type word net-snmp prints; longer words first where they share a start. */
    private enum Kind {
        OPAQUE_FLOAT("Opaque: Float:"), OPAQUE_DOUBLE("Opaque: Double:"), OPAQUE_INT64("Opaque: Int64:"),
        OPAQUE_UINT64("Opaque: UInt64:"), OPAQUE_COUNTER64("Opaque: Counter64:"), OPAQUE("OPAQUE:"),
        HEX_STRING("Hex-STRING:"), STRING("STRING:"), INTEGER("INTEGER:"), OID("OID:"), TIMETICKS("Timeticks:"),
        IP_ADDRESS("IpAddress:"), NETWORK_ADDRESS("Network Address:"), COUNTER32("Counter32:"),
        COUNTER64("Counter64:"), GAUGE32("Gauge32:"), UNSIGNED32("Unsigned32:"), UINTEGER32("UInteger32:"),
        BITS("BITS:"), NULL("NULL"), EMPTY_STRING("\"\"");

        final String word;

        Kind(String word) {
            this.word = word;
        }

        boolean continuesAsHex() {
            return this == HEX_STRING || this == OPAQUE || this == BITS;
        }
    }

    private final String source;
    private final List<String> lines;
    private int next;

    private SnmpwalkParser(String source, List<String> lines) {
        this.source = source;
        this.lines = lines;
    }

    static List<DeviceObject> parse(String source, List<String> lines) throws DeviceDataException {
        return new SnmpwalkParser(source, lines).parseAll();
    }

    static boolean isTrailer(String text) {
        return text.startsWith("No more variables left") || text.startsWith("End of MIB")
                || text.startsWith("No Such Object") || text.startsWith("No Such Instance");
    }

    private List<DeviceObject> parseAll() throws DeviceDataException {
        List<DeviceObject> objects = new ArrayList<>();
        while (next < lines.size()) {
            int lineNo = next + 1;
            String line = lines.get(next++);
            Matcher object = OBJECT_LINE.matcher(line);
            if (!object.matches()) {
                if (line.isBlank() || isTrailer(line.trim())) {
                    continue;
                }
                throw new DeviceDataException(source, lineNo, "expected '.OID = TYPE: VALUE', found '" + line + "'");
            }
            String value = WRONG_TYPE.matcher(object.group(2)).replaceFirst("");
            if (isTrailer(value)) {
                continue;
            }
            Oid oid;
            try {
                oid = Oid.parse(object.group(1));
            } catch (IllegalArgumentException e) {
                throw new DeviceDataException(source, lineNo, "bad OID '" + object.group(1) + "': " + e.getMessage());
            }
            objects.add(parseValue(oid, value, lineNo));
        }
        return objects;
    }

    private DeviceObject parseValue(Oid oid, String value, int lineNo) throws DeviceDataException {
        Kind kind = kindOf(value);
        if (kind == null) {
            throw new DeviceDataException(source, lineNo, "unknown value type in '" + value + "'");
        }
        String rest = value.substring(kind.word.length());
        rest = rest.startsWith(" ") ? rest.substring(1) : rest;
        if (kind == Kind.STRING && rest.startsWith("\"")) {
            return new DeviceObject(oid, BerType.OCTET_STRING, ValueText.octetsText(quoted(rest, lineNo)), lineNo);
        }
        if (kind == Kind.STRING || kind.continuesAsHex()) {
            rest = rest + continuation(kind == Kind.STRING ? "\n" : " ");
        }
        try {
            return convert(oid, kind, rest.strip(), lineNo);
        } catch (IllegalArgumentException e) {
            throw new DeviceDataException(source, lineNo, "bad " + kind.word.replace(":", "") + " value for "
                    + oid + ": " + e.getMessage());
        }
    }

    private static Kind kindOf(String value) {
        for (Kind kind : Kind.values()) {
            if (value.startsWith(kind.word)
                    && (kind != Kind.NULL && kind != Kind.EMPTY_STRING || value.strip().equals(kind.word))) {
                return kind;
            }
        }
        return null;
    }

    private DeviceObject convert(Oid oid, Kind kind, String text, int lineNo) {
        return switch (kind) {
            case STRING -> new DeviceObject(oid, BerType.OCTET_STRING,
                    ValueText.octetsText(text.getBytes(StandardCharsets.ISO_8859_1)), lineNo);
            case EMPTY_STRING -> new DeviceObject(oid, BerType.OCTET_STRING, "", lineNo);
            case HEX_STRING -> octets(oid, BerType.OCTET_STRING, hexOctets(text, false), lineNo);
            case BITS -> octets(oid, BerType.OCTET_STRING, hexOctets(text, true), lineNo);
            case OPAQUE -> octets(oid, BerType.OPAQUE, hexOctets(text, false), lineNo);
            case OPAQUE_FLOAT -> octets(oid, BerType.OPAQUE, OpaqueValues.ofFloat(Float.parseFloat(floatText(text))), lineNo);
            case OPAQUE_DOUBLE -> octets(oid, BerType.OPAQUE,
                    OpaqueValues.ofDouble(Double.parseDouble(floatText(text))), lineNo);
            case OPAQUE_INT64 -> octets(oid, BerType.OPAQUE, OpaqueValues.ofInt64(Long.parseLong(text)), lineNo);
            case OPAQUE_UINT64 -> octets(oid, BerType.OPAQUE, OpaqueValues.ofUInt64(new BigInteger(text)), lineNo);
            case OPAQUE_COUNTER64 -> octets(oid, BerType.OPAQUE, OpaqueValues.ofCounter64(new BigInteger(text)), lineNo);
            case INTEGER -> new DeviceObject(oid, BerType.INTEGER, integerText(text), lineNo);
            case COUNTER32 -> unsigned32(oid, BerType.COUNTER32, text, lineNo);
            case GAUGE32, UNSIGNED32 -> unsigned32(oid, BerType.GAUGE32, text, lineNo);
            case UINTEGER32 -> unsigned32(oid, BerType.UINTEGER32, text, lineNo);
            case TIMETICKS -> new DeviceObject(oid, BerType.TIME_TICKS, ValueText.canonical(BerType.TIME_TICKS,
                    group(TIMETICKS.matcher(text).matches() ? TIMETICKS : LEADING_UNSIGNED, text)), lineNo);
            case COUNTER64 -> new DeviceObject(oid, BerType.COUNTER64,
                    ValueText.canonical(BerType.COUNTER64, group(LEADING_UNSIGNED, text)), lineNo);
            case IP_ADDRESS -> new DeviceObject(oid, BerType.IP_ADDRESS,
                    ValueText.canonical(BerType.IP_ADDRESS, text), lineNo);
            case NETWORK_ADDRESS -> new DeviceObject(oid, BerType.IP_ADDRESS, networkAddress(text), lineNo);
            case OID -> new DeviceObject(oid, BerType.OBJECT_IDENTIFIER,
                    ValueText.canonical(BerType.OBJECT_IDENTIFIER, text), lineNo);
            case NULL -> new DeviceObject(oid, BerType.NULL, "", lineNo);
        };
    }

    private static DeviceObject octets(Oid oid, BerType type, byte[] octets, int lineNo) {
        return new DeviceObject(oid, type, ValueText.octetsText(octets), lineNo);
    }

    private static DeviceObject unsigned32(Oid oid, BerType type, String text, int lineNo) {
        return new DeviceObject(oid, type, ValueText.canonical(type, group(LEADING_UNSIGNED, text)), lineNo);
    }

    private static String integerText(String text) {
        Matcher enumeration = ENUMERATION.matcher(text);
        String number = enumeration.matches() ? enumeration.group(1) : group(LEADING_SIGNED, text);
        return Integer.toString(ValueText.parseInteger(number));
    }

    private static String group(Pattern pattern, String text) {
        Matcher m = pattern.matcher(text);
        if (!m.matches()) {
            throw new IllegalArgumentException("unreadable value '" + text + "'");
        }
        return m.group(1);
    }

    /** net-snmp prints floats with %f: also "nan", "inf", "-inf". */
    private static String floatText(String text) {
        return switch (text.toLowerCase(Locale.ROOT)) {
            case "nan" -> "NaN";
            case "inf", "+inf" -> "Infinity";
            case "-inf" -> "-Infinity";
            default -> text;
        };
    }

    /** Hex octets separated by blanks; for BITS the named bits after the octets are dropped. */
    private static byte[] hexOctets(String text, boolean namedBitsFollow) {
        StringBuilder hex = new StringBuilder();
        for (String token : text.split("\\s+")) {
            if (token.isEmpty()) {
                continue;
            }
            if (!HEX_OCTET.matcher(token).matches()) {
                if (namedBitsFollow) {
                    break;
                }
                throw new IllegalArgumentException("'" + token + "' is not a hex octet");
            }
            hex.append(token);
        }
        return ValueText.fromHex(hex.toString());
    }

    private static String networkAddress(String text) {
        String[] parts = text.split(":", -1);
        if (parts.length != 4) {
            throw new IllegalArgumentException("a Network Address has 4 octets: '" + text + "'");
        }
        StringBuilder hex = new StringBuilder();
        for (String part : parts) {
            hex.append(part.length() == 1 ? "0" + part : part);
        }
        return ValueText.ipText(ValueText.fromHex(hex.toString()));
    }

    /** The octets of a quoted string starting at {@code text}, reading further lines until it closes. */
    private byte[] quoted(String text, int lineNo) throws DeviceDataException {
        StringBuilder content = new StringBuilder();
        String rest = text.substring(1);
        while (!scanQuoted(rest, content)) {
            if (next >= lines.size()) {
                throw new DeviceDataException(source, lineNo, "quoted string not closed");
            }
            content.append('\n');
            rest = lines.get(next++);
        }
        return content.toString().getBytes(StandardCharsets.ISO_8859_1);
    }

    /** Appends the string's characters from {@code line}; true when the closing quote ends the line. */
    private static boolean scanQuoted(String line, StringBuilder content) {
        for (int i = 0; i < line.length(); i++) {
            char c = line.charAt(i);
            if (c == '\\' && i + 1 < line.length()) {
                content.append(line.charAt(++i));
            } else if (c == '"' && line.substring(i + 1).isBlank()) {
                return true;
            } else {
                content.append(c);
            }
        }
        return false;
    }

    /** The following lines that belong to the current value, each preceded by {@code separator}. */
    private String continuation(String separator) {
        StringBuilder more = new StringBuilder();
        while (next < lines.size()) {
            String line = lines.get(next);
            if (OBJECT_LINE.matcher(line).matches() || isTrailer(line.trim())) {
                break;
            }
            more.append(separator).append(line);
            next++;
        }
        return more.toString();
    }
}
