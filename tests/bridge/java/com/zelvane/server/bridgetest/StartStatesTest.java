package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import java.util.List;
import java.util.Map;
import org.junit.jupiter.api.Test;

/** Events and queries before native_init, and after a start that could not connect. */
class StartStatesTest {
    static final String T = "|" + Bridge.TAG + "|";

    @Test
    void EventsBeforeInit_WhenInitConnects_AreDeliveredAfterItInOrder() {
        ChildJvm child = ChildJvm.run("before-init", Map.of()).assertClean(0);
        assertEquals(List.of("locale=0", "orientation=0", "clipboard=0", "launchAllowedBeforeConnect=true",
                        "adIdBeforeConnect=-1", "exchangesBeforeInit=0"),
                child.reported("RESULT"),
                "events are accepted before the start; queries are refused (true, -1) without reaching the host");
        assertEquals(Bridge.hex(List.of(Wire.op(12).str("en-US").bytes(), Wire.op(7).i32(1).bytes(),
                        Wire.op(18).str("early").bytes())),
                child.reported("REQ"), "the waiting events reach the host after native_init, in order");
    }

    @Test
    void FailedStart_WhenDeviceIsMissing_AcceptsEventsSendsNothingAndLogsTheFailure() {
        ChildJvm child = ChildJvm.run("failed-start", Map.of("VMSG_DEVICE_FAIL", "open")).assertClean(0);
        List<String> results = child.reported("RESULT");
        assertEquals(List.of("locale=0", "orientation=0", "launchAllowed=true", "adId=-1",
                        "exchangesAfterFailedStart=0", "connectsAfterFailedStart=0"),
                results.subList(0, 6), "events accepted, queries refused, nothing sent");
        List<String> lines = child.reported("LINE");
        assertTrue(lines.stream().anyMatch(l -> l.endsWith("|hcallLibInitGuest failed, error -1")),
                "the connection failure goes through the logger at error level:\n" + child.output);
        assertEquals(List.of("4" + T + "jint JNI_OnLoad(JavaVM *, void *) called",
                        "3" + T + "void native_init(JNIEnv *, jobject): called"),
                lines.stream().filter(l -> l.contains(T)).toList(), "a failed start writes no returning line");
    }
}
