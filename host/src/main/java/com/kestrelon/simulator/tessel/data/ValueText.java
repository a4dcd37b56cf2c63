package com.kestrelon.simulator.tessel.data;

import java.io.ByteArrayOutputStream;
import java.math.BigInteger;
import java.nio.charset.StandardCharsets;
import java.util.ArrayList;
import java.util.HexFormat;
import java.util.List;
import java.util.regex.Pattern;

/**
 * The value texts exchanged with the engine, and their conversion to and from BER content octets.
 *
 * <p>The forms the host gives the engine, by type:
 * <ul>
 *   <li>OCTET STRING (4), BIT STRING (3), Opaque (68), NsapAddress (69): the octets as
 *       {@code 'hex'h} with lowercase hex digits, e.g. {@code '0a1b'h}; no octets is the empty
 *       text {@code ""}.</li>
 *   <li>OBJECT IDENTIFIER (6): dotted decimal with a leading dot, {@code .1.3.6.1}.</li>
 *   <li>IpAddress (64): dotted decimal, {@code 10.0.0.1}.</li>
 *   <li>INTEGER (2): signed 32-bit decimal.</li>
 *   <li>Counter32 (65), Gauge32 (66), TimeTicks (67), UInteger32 (71): unsigned 32-bit decimal.</li>
 *   <li>Counter64 (70): unsigned 64-bit decimal, up to 18446744073709551615.</li>
 *   <li>NULL (5): the empty text.</li>
 * </ul>
 *
 * <p>Texts coming back from the engine (set values) are read by type: for the octet types a text
 * {@code 'hex'h} or {@code 'hex'H} with an even number of hex digits gives those octets and any
 * other text gives its UTF-8 bytes; an OID may come with or without its leading dot; the other
 * types read as above. Stateless; safe from any thread.
 */
public final class ValueText {
    private static final Pattern SIGNED = Pattern.compile("-?[0-9]{1,20}");
    private static final Pattern UNSIGNED = Pattern.compile("[0-9]{1,20}");
    private static final Pattern HEX_TEXT = Pattern.compile("'((?:[0-9a-fA-F]{2})*)'[hH]");

    private ValueText() {
    }

    /** The engine text of octets: {@code ""} when there are none, else {@code 'hex'h}. */
    public static String octetsText(byte[] octets) {
        return octets.length == 0 ? "" : "'" + HexFormat.of().formatHex(octets) + "'h";
    }

    /** The octets of an octet-typed text from the engine: {@code 'hex'h}/{@code 'hex'H} or UTF-8 text. */
    public static byte[] parseOctets(String text) {
        var hex = HEX_TEXT.matcher(text);
        return hex.matches() ? fromHex(hex.group(1)) : text.getBytes(StandardCharsets.UTF_8);
    }

    /**
     * The BER content octets (the encoding without tag and length) of a value text.
     *
     * @throws IllegalArgumentException when the text is not a value of that type
     */
    public static byte[] toContents(BerType type, String text) {
        switch (type) {
            case OCTET_STRING, BIT_STRING, OPAQUE, NSAP_ADDRESS:
                return parseOctets(text);
            case NULL:
                require(text.isEmpty(), "a NULL value has no text: '" + text + "'");
                return new byte[0];
            case INTEGER:
                return BigInteger.valueOf(parseInteger(text)).toByteArray();
            case COUNTER32, GAUGE32, TIME_TICKS, UINTEGER32:
                return BigInteger.valueOf(parseUnsigned32(text)).toByteArray();
            case COUNTER64:
                return new BigInteger(Long.toUnsignedString(parseUnsigned64(text))).toByteArray();
            case IP_ADDRESS:
                return parseIpAddress(text);
            case OBJECT_IDENTIFIER:
                return encodeOid(parseOidValue(text));
            default:
                throw new IllegalArgumentException("unknown type " + type);
        }
    }

    /**
     * The engine text of BER content octets of the given type.
     *
     * @throws IllegalArgumentException when the octets are not a valid value of that type
     */
    public static String fromContents(BerType type, byte[] contents) {
        switch (type) {
            case OCTET_STRING, BIT_STRING, OPAQUE, NSAP_ADDRESS:
                return octetsText(contents);
            case NULL:
                require(contents.length == 0, "a NULL value has no content octets");
                return "";
            case INTEGER: {
                require(contents.length >= 1 && contents.length <= 4, "an INTEGER has 1 to 4 content octets");
                return Integer.toString(new BigInteger(contents).intValueExact());
            }
            case COUNTER32, GAUGE32, TIME_TICKS, UINTEGER32:
                return decodeUnsigned(contents, 32).toString();
            case COUNTER64:
                return decodeUnsigned(contents, 64).toString();
            case IP_ADDRESS:
                require(contents.length == 4, "an IpAddress has 4 content octets");
                return ipText(contents);
            case OBJECT_IDENTIFIER:
                return decodeOid(contents).toDottedText();
            default:
                throw new IllegalArgumentException("unknown type " + type);
        }
    }

    /** The canonical engine text of a value text of the given type (e.g. a set value). */
    public static String canonical(BerType type, String text) {
        return switch (type) {
            case INTEGER -> Integer.toString(parseInteger(text));
            case COUNTER32, GAUGE32, TIME_TICKS, UINTEGER32 -> Long.toString(parseUnsigned32(text));
            case COUNTER64 -> Long.toUnsignedString(parseUnsigned64(text));
            default -> fromContents(type, toContents(type, text));
        };
    }

    /** Signed 32-bit decimal text to its value. */
    public static int parseInteger(String text) {
        require(SIGNED.matcher(text).matches(), "not a decimal integer: '" + text + "'");
        long value = text.length() <= 12 ? Long.parseLong(text) : Long.MAX_VALUE;
        require(value >= Integer.MIN_VALUE && value <= Integer.MAX_VALUE, "out of the INTEGER range: " + text);
        return (int) value;
    }

    /** Unsigned 32-bit decimal text to its value. */
    public static long parseUnsigned32(String text) {
        require(UNSIGNED.matcher(text).matches(), "not an unsigned decimal number: '" + text + "'");
        require(text.length() <= 18 && Long.parseLong(text) <= 0xFFFF_FFFFL, "exceeds 4294967295: " + text);
        return Long.parseLong(text);
    }

    /** Unsigned 64-bit decimal text to its value (as the bits of a long). */
    public static long parseUnsigned64(String text) {
        require(UNSIGNED.matcher(text).matches(), "not an unsigned decimal number: '" + text + "'");
        BigInteger value = new BigInteger(text);
        require(value.bitLength() <= 64, "exceeds 18446744073709551615: " + text);
        return value.longValue();
    }

    /** Dotted IPv4 text to its 4 octets. */
    public static byte[] parseIpAddress(String text) {
        String[] parts = text.split("\\.", -1);
        require(parts.length == 4, "not an IPv4 address: '" + text + "'");
        byte[] octets = new byte[4];
        for (int i = 0; i < 4; i++) {
            require(parts[i].matches("[0-9]{1,3}") && Integer.parseInt(parts[i]) <= 255,
                    "not an IPv4 address: '" + text + "'");
            octets[i] = (byte) Integer.parseInt(parts[i]);
        }
        return octets;
    }

    /** An OID value: dotted text, leading dot optional, at least two sub-identifiers. */
    public static Oid parseOidValue(String text) {
        Oid oid = Oid.parse(text);
        require(oid.length() >= 2, "an OID value has at least two sub-identifiers: '" + text + "'");
        require(oid.get(0) <= 2 && (oid.get(0) == 2 || oid.get(1) < 40), "not an encodable OID value: '" + text + "'");
        return oid;
    }

    /** The dotted text of 4 IPv4 address octets. */
    public static String ipText(byte[] octets) {
        return (octets[0] & 0xff) + "." + (octets[1] & 0xff) + "." + (octets[2] & 0xff) + "." + (octets[3] & 0xff);
    }

    /** Hex digits (even count, either case) to octets. */
    static byte[] fromHex(String hex) {
        require(hex.length() % 2 == 0, "odd number of hex digits");
        require(hex.chars().allMatch(HexFormat::isHexDigit), "not hexadecimal: '" + hex + "'");
        return HexFormat.of().parseHex(hex);
    }

    private static BigInteger decodeUnsigned(byte[] contents, int bits) {
        require(contents.length >= 1 && contents.length <= bits / 8 + 1,
                "an unsigned " + bits + "-bit number has 1 to " + (bits / 8 + 1) + " content octets");
        BigInteger value = new BigInteger(contents);
        if (value.signum() < 0 && contents.length <= bits / 8) {
            // Some agents leave out the leading zero octet; read such values as unsigned.
            value = value.add(BigInteger.ONE.shiftLeft(8 * contents.length));
        }
        require(value.signum() >= 0 && value.bitLength() <= bits, "out of the unsigned " + bits + "-bit range");
        return value;
    }

    private static byte[] encodeOid(Oid oid) {
        ByteArrayOutputStream out = new ByteArrayOutputStream();
        writeBase128(out, oid.get(0) * 40 + oid.get(1));
        for (int i = 2; i < oid.length(); i++) {
            writeBase128(out, oid.get(i));
        }
        return out.toByteArray();
    }

    private static void writeBase128(ByteArrayOutputStream out, long value) {
        int groups = 1;
        while (groups < 10 && (value >>> (7 * groups)) != 0) {
            groups++;
        }
        for (int g = groups - 1; g >= 0; g--) {
            int septet = (int) (value >>> (7 * g)) & 0x7f;
            out.write(g == 0 ? septet : septet | 0x80);
        }
    }

    private static Oid decodeOid(byte[] contents) {
        require(contents.length >= 1, "an OID value has content octets");
        List<Long> ids = new ArrayList<>();
        long value = 0;
        int septets = 0;
        for (int i = 0; i < contents.length; i++) {
            int b = contents[i] & 0xff;
            require(septets > 0 || b != 0x80, "non-minimal OID sub-identifier");
            value = value << 7 | (b & 0x7f);
            septets++;
            require(septets <= 5, "OID sub-identifier too large");
            if ((b & 0x80) == 0) {
                if (ids.isEmpty()) {
                    long first = Math.min(value / 40, 2);
                    ids.add(first);
                    ids.add(value - first * 40);
                } else {
                    ids.add(value);
                }
                value = 0;
                septets = 0;
            }
        }
        require(septets == 0, "truncated OID value");
        return Oid.of(ids.stream().mapToLong(Long::longValue).toArray());
    }

    private static void require(boolean condition, String reason) {
        if (!condition) {
            throw new IllegalArgumentException(reason);
        }
    }
}
