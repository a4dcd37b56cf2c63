package com.kestrelon.simulator.tessel.data;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;

import java.nio.charset.StandardCharsets;
import java.util.List;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

class SnmpwalkTest {
    private static final String OID = ".1.3.6.1.4.1.32473.7.0";

    private static String hexOf(String text) {
        return ValueText.octetsText(text.getBytes(StandardCharsets.UTF_8));
    }

    @ParameterizedTest
    @CsvSource(delimiter = '|', quoteCharacter = '`', value = {
        "STRING: \"a \\\"quoted\\\" \\\\ word\"     | 4  | `'61202271756f74656422205c20776f7264'h`",
        "STRING: plain text, unquoted            | 4  | `'706c61696e20746578742c20756e71756f746564'h`",
        "STRING:                                 | 4  | ``",
        "\"\"                                    | 4  | ``",
        "Hex-STRING: 00 1A ff                    | 4  | `'001aff'h`",
        "BITS: 80 40 ipv4(0) ipv6(9)             | 4  | `'8040'h`",
        "INTEGER: ethernetCsmacd(6)              | 2  | 6",
        "INTEGER: -200 milliseconds              | 2  | -200",
        "OID: .1.3.6.1.6.3.1                     | 6  | .1.3.6.1.6.3.1",
        "Timeticks: (8723412) 1 day, 0:13:54.12  | 67 | 8723412",
        "IpAddress: 10.1.2.3                     | 64 | 10.1.2.3",
        "Network Address: AC:10:4:FE             | 64 | 172.16.4.254",
        "Counter32: 30000 milli-seconds          | 65 | 30000",
        "Unsigned32: 5                           | 66 | 5",
        "UInteger32: 5                           | 71 | 5",
        "Counter64: 18446744073709551615         | 70 | 18446744073709551615",
        "OPAQUE: 9F 78 04 42 28 00 00            | 68 | `'9f780442280000'h`",
        "Opaque: Float: 42.000000                | 68 | `'9f780442280000'h`",
        "Opaque: Float: inf                      | 68 | `'9f78047f800000'h`",
        "Opaque: Double: -1.500000               | 68 | `'9f7908bff8000000000000'h`",
        "Opaque: Int64: -2                       | 68 | `'9f7a01fe'h`",
        "Opaque: UInt64: 18446744073709551615    | 68 | `'9f7b0900ffffffffffffffff'h`",
        "Opaque: Counter64: 256                  | 68 | `'9f76020100'h`",
        "NULL                                    | 5  | ``",
        "Wrong Type (should be OCTET STRING): INTEGER: 3 | 2 | 3",
    })
    void readsEachValueForm(String value, int type, String text) throws Exception {
        DeviceObject object = DeviceData.parse("w", OID + " = " + value.strip()).objects().get(0);
        assertEquals(type, object.typeNumber());
        assertEquals(text == null ? "" : text, object.value());
    }

    @Test
    void readsValuesContinuedOverLinesAndSkipsTrailers() throws Exception {
        DeviceData data = DeviceData.parse("w", String.join("\n",
                ".1.3.6.1.2.1.1.1.0 = STRING: \"first line",
                "",
                "  \\\"third\\\" = line\"",
                ".1.3.6.1.2.1.1.2.0 = Hex-STRING: 00 01 02 03 04 05 06 07 08 09 0A 0B 0C 0D 0E 0F ",
                "10 11 ",
                ".1.3.6.1.2.1.1.3.0 = STRING: Linux box",
                "kernel 6.1",
                "End of MIB",
                ".1.3.6.1.2.1.1.4.0 = No Such Object available on this agent at this OID",
                ".1.3.6.1.2.1.1.5.0 = No Such Instance currently exists at this OID",
                ".1.3.6.1.2.1.1.6.0 = INTEGER: 1",
                ".1.3.6.1.2.1.1.6.0 = No more variables left in this MIB View (It is past the end of the MIB tree)"));
        assertEquals(List.of(hexOf("first line\n\n  \"third\" = line"), "'000102030405060708090a0b0c0d0e0f1011'h",
                hexOf("Linux box\nkernel 6.1"), "1"), data.objects().stream().map(DeviceObject::value).toList());
        assertEquals(11, data.objects().get(3).line());
    }

    @ParameterizedTest
    @CsvSource(delimiter = ';', value = {
        ".1.3.6.1.2.1.1.1.0 = STRING: \"never closed\\nmore text; w:1: quoted string not closed",
        ".1.3.6.1.2.1.1.1.0 = INTEGER: 1\\nstray text; w:2: expected '.OID = TYPE: VALUE', found 'stray text'",
        ".1.3.6.1.2.1.1.1.0 = Hex-STRING: 00 GG; w:1: bad Hex-STRING value for 1.3.6.1.2.1.1.1.0: 'GG' is not a hex octet",
        ".1.3.6.1.2.1.1.1.0 = OID: SNMPv2-MIB::snmpMIB; w:1: bad OID value for 1.3.6.1.2.1.1.1.0: malformed object identifier 'SNMPv2-MIB::snmpMIB'",
        ".1.3.6.1.2.1.1.1.0 = Opaque: Float: lots; w:1: bad Opaque Float value for 1.3.6.1.2.1.1.1.0: For input string: \"lots\"",
        ".1.3.6.1.2.1.1.1.0 = Opaque: UInt64: -1; w:1: bad Opaque UInt64 value for 1.3.6.1.2.1.1.1.0: out of the unsigned 64-bit range: -1",
        ".1.3.6.1.2.1.1.1.0 = Float: 1.5; w:1: unknown value type in 'Float: 1.5'",
        ".1.3.6.1.2.1.1.1.0 = INTEGER: 1\\n.1.3.6.1.2.1.1.1.0 = INTEGER: 2; w:2: duplicate OID 1.3.6.1.2.1.1.1.0 (first on line 1)",
    })
    void reportsDataErrorsAsFileLineReason(String content, String message) {
        var error = assertThrows(DeviceDataException.class, () -> DeviceData.parse("w", content.replace("\\n", "\n")));
        assertEquals(message, error.getMessage());
    }
}
