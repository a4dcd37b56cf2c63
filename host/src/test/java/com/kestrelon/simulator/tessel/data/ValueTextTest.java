package com.kestrelon.simulator.tessel.data;

import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;

import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

class ValueTextTest {

    @ParameterizedTest
    @CsvSource(quoteCharacter = '`', value = {
        "INTEGER, -1, ff",
        "INTEGER, 128, 0080",
        "INTEGER, -2147483648, 80000000",
        "COUNTER32, 4294967295, 00ffffffff",
        "TIME_TICKS, 8723412, 00851bd4",
        "COUNTER64, 18446744073709551615, 00ffffffffffffffff",
        "OBJECT_IDENTIFIER, .1.3.6.1.4.1.4294967295.200, 2b060104018fffffff7f8148",
        "OBJECT_IDENTIFIER, .2.999.3, 883703",
        "OBJECT_IDENTIFIER, .0.0, 00",
        "IP_ADDRESS, 172.16.4.254, ac1004fe",
        "NULL, ``, ``",
        "OCTET_STRING, `'00ff'h`, 00ff",
        "OCTET_STRING, ``, ``",
        "OPAQUE, `'9f780442280000'h`, 9f780442280000",
    })
    void convertsBetweenEngineTextAndContentOctets(BerType type, String text, String contentsHex) {
        String canonicalText = text == null ? "" : text;
        byte[] contents = ValueText.fromHex(contentsHex == null ? "" : contentsHex);
        assertArrayEquals(contents, ValueText.toContents(type, canonicalText));
        assertEquals(canonicalText, ValueText.fromContents(type, contents));
    }

    @ParameterizedTest
    @CsvSource(quoteCharacter = '`', value = {
        "OCTET_STRING, `'0A0b'H`, `'0a0b'h`",
        "OCTET_STRING, abc, `'616263'h`",
        "OCTET_STRING, `'abc'h`, `'276162632768'h`",
        "OCTET_STRING, caf\u00e9, `'636166c3a9'h`",
        "OCTET_STRING, `''h`, ``",
        "OBJECT_IDENTIFIER, 1.3.6.1, .1.3.6.1",
        "INTEGER, -0, 0",
        "COUNTER64, 007, 7",
    })
    void readsSetTextsFromTheEngineByType(BerType type, String setText, String canonical) {
        assertEquals(canonical == null ? "" : canonical, ValueText.canonical(type, setText == null ? "" : setText));
    }

    @ParameterizedTest
    @CsvSource({
        "INTEGER, 2147483648", "INTEGER, 1e3", "INTEGER, ''", "COUNTER32, -1", "GAUGE32, 4294967296",
        "COUNTER64, 18446744073709551616", "IP_ADDRESS, 1.2.3", "IP_ADDRESS, 1.2.3.4.5",
        "OBJECT_IDENTIFIER, 3.1", "OBJECT_IDENTIFIER, .1", "NULL, x",
    })
    void rejectsTextsThatAreNotOfTheType(BerType type, String text) {
        assertThrows(IllegalArgumentException.class, () -> ValueText.toContents(type, text));
    }

    @ParameterizedTest
    @CsvSource({
        "COUNTER32, ffffffff, 4294967295", "OBJECT_IDENTIFIER, 2b, .1.3", "INTEGER, 0080000000,",
        "COUNTER32, ff00000000,", "IP_ADDRESS, 0a0000,", "OBJECT_IDENTIFIER, 2b86,", "OBJECT_IDENTIFIER, 2b8001,",
        "OBJECT_IDENTIFIER, 2b8180808080808080808001,",
    })
    void decodesAgentQuirksAndRejectsMalformedContents(BerType type, String contentsHex, String text) {
        byte[] contents = ValueText.fromHex(contentsHex);
        if (text != null) {
            assertEquals(text, ValueText.fromContents(type, contents));
        } else {
            assertThrows(IllegalArgumentException.class, () -> ValueText.fromContents(type, contents));
        }
    }
}
