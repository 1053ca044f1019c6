package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;

import org.junit.jupiter.api.BeforeAll;
import org.junit.jupiter.api.Test;

/** getStringFromJstring, called straight from Java through the test helper. */
class JavaStringTest {
    @BeforeAll
    static void load() {
        Bridge.load();
    }

    @Test
    void GetStringFromJstring_WhenStringHasNonAsciiNulAndSupplementary_YieldsModifiedUtf8() {
        byte[] expected = {(byte) 0xC3, (byte) 0xA9, (byte) 0xC0, (byte) 0x80, (byte) 0xED, (byte) 0xA0,
            (byte) 0xBD, (byte) 0xED, (byte) 0xB8, (byte) 0x80, 'z'};
        assertArrayEquals(expected, TestNative.convert("\u00e9\u0000\uD83D\uDE00z"),
                "U+0000 as C0 80, U+1F600 as two three-byte surrogates");
    }

    @Test
    void GetStringFromJstring_WhenEmptyOrNull_YieldsEmptyAndRaisesOnlyForNull() {
        assertArrayEquals(new byte[0], TestNative.convert(""), "empty converts without an exception");
        IllegalArgumentException thrown = assertThrows(IllegalArgumentException.class, () -> TestNative.convert(null));
        assertEquals("Null argument", thrown.getMessage());
    }

    /** Regression: the conversion read and gave back a null pointer when the runtime lent nothing. */
    @Test
    void GetStringFromJstring_WhenRuntimeLendsNoBytes_YieldsEmptyAndGivesNothingBack() {
        int[] counts = TestNative.convertStarved("abc");
        assertArrayEquals(new int[] {0, 0, 0}, counts, "empty result, and no release of bytes never lent");
    }
}
