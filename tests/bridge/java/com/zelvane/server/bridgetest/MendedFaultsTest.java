package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import java.nio.file.Path;
import java.util.List;
import java.util.Map;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;

/** Regression tests for faults the bridge once had (see each test's name). */
class MendedFaultsTest {
    static final String T = "|" + Bridge.TAG + "|";

    /**
     * Fault: after a null string raised "Null argument" the later strings of
     * the call were still converted with the exception pending, which
     * -Xcheck:jni reports. They now count as empty.
     */
    @Test
    void LaterStrings_WhenAnEarlierStringWasNull_AreNotTouchedAndCountAsEmpty() {
        ChildJvm child = ChildJvm.run("null-then-strings", Map.of()).assertClean(0);
        assertEquals(List.of("call0=Null argument", "call1=Null argument", "call2=Null argument"),
                child.reported("RESULT"), "Java sees the first exception of each call");
        assertEquals(Bridge.hex(List.of(Wire.op(13).str("p").str("a").str("").i32(1).str("").str("").str("")
                        .bool(true).bytes())),
                child.reported("REQ"),
                "a required string after the null is empty (refused); unchecked ones travel empty");
    }

    /**
     * Fault: a second native_init opened a second connection over the first
     * and started a second worker.
     */
    @Test
    void SecondInit_AfterASuccessfulStart_StartsNothingButRereadsTheDebugProperty(@TempDir Path dir) {
        ChildJvm child = ChildJvm.run("second-init",
                Map.of("HOSTCALL_PROPERTIES_FILE", dir.resolve("p.prop").toString())).assertClean(0);
        assertEquals(List.of("workersFromFirstInit=1", "workersFromSecondInit=0", "connects=1", "openDevices=1",
                        "orientation=0"),
                child.reported("RESULT"), "one worker, one connection");
        assertEquals(Bridge.hex(List.of(Wire.op(7).i32(4).bytes())), child.reported("REQ"));
        List<String> lines = child.reported("LINE");
        assertTrue(lines.contains("4" + T + "void native_init(JNIEnv *, jobject): service already started"),
                "the second call says why it starts nothing:\n" + child.output);
        assertTrue(lines.contains("3" + T + "jint onOrientationChanged(JNIEnv *, jobject, int): orientation = 4"),
                "the second call still read the property, now on:\n" + child.output);
    }

    /** Fault: a failed start could never be recovered; native_init now retries the failed steps. */
    @Test
    void InitAfterFailedStart_WhenTheDeviceAppears_ConnectsAndDeliversWhatWaited() {
        ChildJvm child = ChildJvm.run("failed-start", Map.of("VMSG_DEVICE_FAIL", "open")).assertClean(0);
        assertEquals(Bridge.hex(List.of(Wire.op(12).str("en-GB").bytes(), Wire.op(7).i32(2).bytes())),
                child.reported("REQ"), "the queued events go out in order once the retry connects");
        assertEquals("openDevices=1", child.reported("RESULT").get(6), "one connection after the retry");
    }
}
