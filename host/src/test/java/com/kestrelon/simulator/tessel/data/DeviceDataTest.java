package com.kestrelon.simulator.tessel.data;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import java.util.List;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

class DeviceDataTest {

    private static String summary(DeviceData data) {
        StringBuilder text = new StringBuilder();
        for (DeviceObject o : data.objects()) {
            text.append(o.oid()).append(' ').append(o.typeNumber()).append(' ').append(o.value()).append('\n');
        }
        return text.toString();
    }

    @Test
    void readsEverySnmprecTagIntoEngineTexts() throws Exception {
        DeviceData data = DeviceData.parse("dev", String.join("\n",
                "# comment", "",
                "1.3.6.1.2.1.1.1.0|4|text | with bars ",
                "1.3.6.1.2.1.1.2.0|6|1.3.6.1.4.1.32473",
                "1.3.6.1.2.1.1.3.0|67|4294967295",
                "1.3.6.1.2.1.1.4.0|4x|00FF0a",
                "1.3.6.1.2.1.1.5.0|4|",
                "1.3.6.1.2.1.1.7.0|2|-2147483648",
                "1.3.6.1.9.1.0|2x|3432",
                "1.3.6.1.9.2.0|3x|80",
                "1.3.6.1.9.3.0|5|",
                "1.3.6.1.9.4.0|64|10.0.0.1",
                "1.3.6.1.9.5.0|64x|0a000002",
                "1.3.6.1.9.6.0|65|0",
                "1.3.6.1.9.7.0|66|4294967295",
                "1.3.6.1.9.8.0|68x|9f780442280000",
                "1.3.6.1.9.9.0|69x|4700",
                "1.3.6.1.9.10.0|70|18446744073709551615",
                "1.3.6.1.9.11.0|71|7",
                "1.3.6.1.9.12.0|4|caf\u00e9\r"));
        assertEquals("""
                1.3.6.1.2.1.1.1.0 4 '74657874207c2077697468206261727320'h
                1.3.6.1.2.1.1.2.0 6 .1.3.6.1.4.1.32473
                1.3.6.1.2.1.1.3.0 67 4294967295
                1.3.6.1.2.1.1.4.0 4 '00ff0a'h
                1.3.6.1.2.1.1.5.0 4\s
                1.3.6.1.2.1.1.7.0 2 -2147483648
                1.3.6.1.9.1.0 2 42
                1.3.6.1.9.2.0 3 '80'h
                1.3.6.1.9.3.0 5\s
                1.3.6.1.9.4.0 64 10.0.0.1
                1.3.6.1.9.5.0 64 10.0.0.2
                1.3.6.1.9.6.0 65 0
                1.3.6.1.9.7.0 66 4294967295
                1.3.6.1.9.8.0 68 '9f780442280000'h
                1.3.6.1.9.9.0 69 '4700'h
                1.3.6.1.9.10.0 70 18446744073709551615
                1.3.6.1.9.11.0 71 7
                1.3.6.1.9.12.0 4 '636166c3a9'h
                """, summary(data));
    }

    @Test
    void servesObjectsInUnsignedOidOrderWhateverTheFileOrder() throws Exception {
        DeviceData data = DeviceData.parse("dev", String.join("\n",
                "1.3.6.1.4.1.4294967295.0|2|5",
                "1.3.6.1.4.1.10.0|2|4",
                "1.3.6.1.4.1.2147483648.0|2|3",
                "1.3.6.1.4.1.9.0|2|2",
                "1.3.6.1.4.1.9|2|1"));
        assertEquals(List.of("1.3.6.1.4.1.9", "1.3.6.1.4.1.9.0", "1.3.6.1.4.1.10.0", "1.3.6.1.4.1.2147483648.0",
                "1.3.6.1.4.1.4294967295.0"), data.objects().stream().map(o -> o.oid().toString()).toList());
        assertEquals("3", data.get(Oid.parse(".1.3.6.1.4.1.2147483648.0")).orElseThrow().value());
        assertTrue(data.get(Oid.parse("1.3.6.1.4.1.10")).isEmpty());
        assertEquals("1.3.6.1.4.1.10.0", data.next(Oid.parse("1.3.6.1.4.1.9.0")).orElseThrow().oid().toString());
        assertEquals("1.3.6.1.4.1.2147483648.0", data.next(Oid.parse("1.3.6.1.4.1.11")).orElseThrow().oid().toString());
        assertTrue(data.next(Oid.parse("1.3.6.1.4.1.4294967295.0")).isEmpty());
    }

    @ParameterizedTest
    @CsvSource(delimiter = ';', value = {
        "1.3.6.1.2.1.1.1.0|4|x\\n1.3.6.1.2.1.1.2.0|4:numeric|x; dev:2: variation modules are not supported (tag '4:numeric')",
        "1.3.6.1.2.1.1.1.0|4|x\\n\\n1.3.6.1.2.1.1.1.0|4|y; dev:3: duplicate OID 1.3.6.1.2.1.1.1.0 (first on line 1)",
        "1.3.6.1.2.1.1.1.0|4|x\\n1.3.6.1.2.1.1.2.0 4 x; dev:2: expected OID|TAG|VALUE",
        "1.3.6.1.2.1.1.1.0|99|x; dev:1: unknown tag '99'",
        "1.3.6.1.2.1.1.1.0|4e|x; dev:1: unknown tag '4e'",
        "1.3.6.1.2.1.1.1.0|2|2147483648; dev:1: bad INTEGER value for 1.3.6.1.2.1.1.1.0: out of the INTEGER range: 2147483648",
        "1.3.6.1.2.1.1.1.0|4x|abc; dev:1: bad OCTET_STRING value for 1.3.6.1.2.1.1.1.0: odd number of hex digits",
        "1.3.6.1.2..1|4|x; dev:1: bad OID '1.3.6.1.2..1': malformed object identifier '1.3.6.1.2..1'",
        "1.3.6.1.4294967296|4|x; dev:1: bad OID '1.3.6.1.4294967296': sub-identifier 4294967296 exceeds 4294967295",
        "# only a comment; dev:1: no objects in the data",
        "sysDescr.0 = STRING: x; dev:1: unknown format: expected 'OID|TAG|VALUE' (snmprec) or 'OID = TYPE: VALUE' (snmpwalk -On)",
    })
    void reportsDataErrorsAsFileLineReason(String content, String message) {
        var error = assertThrows(DeviceDataException.class,
                () -> DeviceData.parse("dev", content.replace("\\n", "\n")));
        assertEquals(message, error.getMessage());
    }
}
