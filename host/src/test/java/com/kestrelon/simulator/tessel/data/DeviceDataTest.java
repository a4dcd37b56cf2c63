package com.kestrelon.simulator.tessel.data;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;

import java.util.stream.Collectors;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

class DeviceDataTest {

    @Test
    void readsSnmprecValuesIntoEngineTexts() throws Exception {
        DeviceData data = DeviceData.parse("dev", String.join("\n",
                "# comment", "",
                "1.3.6.1.2.1.1.1.0|4|text | with bars ",
                "1.3.6.1.2.1.1.4.0|4x|00FF0a",
                "1.3.6.1.2.1.1.5.0|4|",
                "1.3.6.1.2.1.1.6.0|4|lone\rcarriage return\r",
                "1.3.6.1.9.1.0|2x|3432",
                "1.3.6.1.9.2.0|3x|80",
                "1.3.6.1.9.5.0|64x|0a000002",
                "1.3.6.1.9.8.0|68x|9f780442280000",
                "1.3.6.1.9.12.0|4|caf\u00e9"));
        assertEquals("""
                1.3.6.1.2.1.1.1.0 4 '74657874207c2077697468206261727320'h
                1.3.6.1.2.1.1.4.0 4 '00ff0a'h
                1.3.6.1.2.1.1.5.0 4\s
                1.3.6.1.2.1.1.6.0 4 '6c6f6e650d63617272696167652072657475726e'h
                1.3.6.1.9.1.0 2 42
                1.3.6.1.9.2.0 3 '80'h
                1.3.6.1.9.5.0 64 10.0.0.2
                1.3.6.1.9.8.0 68 '9f780442280000'h
                1.3.6.1.9.12.0 4 '636166c3a9'h
                """, data.objects().stream().map(o -> o.oid() + " " + o.typeNumber() + " " + o.value() + "\n")
                .collect(Collectors.joining()));
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
        "1.3.6.1.2.1.1.1.0|4x|0g; dev:1: bad OCTET_STRING value for 1.3.6.1.2.1.1.1.0: not hexadecimal: '0g'",
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
