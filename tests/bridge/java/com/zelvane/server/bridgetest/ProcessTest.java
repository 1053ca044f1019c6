package com.zelvane.server.bridgetest;

import static com.zelvane.server.bridgetest.Bridge.debug;
import static com.zelvane.server.bridgetest.Bridge.error;
import static com.zelvane.server.bridgetest.Bridge.task;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import java.nio.file.Path;
import java.util.List;
import java.util.Map;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.ValueSource;

/** Loading, starting, the debug switch and the exit, each in a JVM of its own ({@link Scenarios}). */
class ProcessTest {
    static final String ON_LOAD = "4|" + Bridge.TAG + "|jint JNI_OnLoad(JavaVM *, void *) called";
    static final String INIT = "void native_init(JNIEnv *, jobject)";

    /**
     * The switch is on for a property that atoi reads as a non-zero number,
     * and stays on; a repeated native_init starts nothing but reads it again.
     */
    @ParameterizedTest
    @ValueSource(strings = {"-1", " 7", "3x"})
    void NativeInit_WhenRepeatedWithEachDebugValue_StartsOnceAndSwitchesOnForNonZeroNumbers(String onValue,
            @TempDir Path dir) {
        ChildJvm child = ChildJvm.run(Map.of("HOSTCALL_PROPERTIES_FILE", dir.resolve("p.prop").toString()),
                "debug", onValue);
        assertEquals(List.of("first=workers 1", "[0]=workers 0 on false", "[]=workers 0 on false",
                        "[abc]=workers 0 on false", "[-0]=workers 0 on false", "[" + onValue + "]=workers 0 on true",
                        "[0]=workers 0 on true", "openDevices=1", "alreadyStarted=6"),
                child.reported("RESULT"), "one worker and one connection whatever the number of starts");
        String locale = task("jint onLocaleChanged(JNIEnv *, jobject, jstring)");
        List<String> expected = List.of(ON_LOAD, debug(INIT + ": called"), debug(INIT + ": returning, rval = 0"),
                debug("jint onVibrate(JNIEnv *, jobject, jint, jstring) called"),
                error("RPC failed for " + locale + ", error -5"));
        List<String> lines = child.reported("LINE");
        assertEquals(expected.subList(0, 3), lines.subList(0, Math.min(3, lines.size())),
                "entry and start lines first");
        assertEquals(expected.stream().sorted().toList(), lines.stream().sorted().toList(),
                "with the switch off only these lines are written");
    }

    @Test
    void Start_WhenTheDeviceIsMissing_KeepsEventsRefusesQueriesAndDeliversOnceAStartSucceeds() {
        ChildJvm child = ChildJvm.run(Map.of("VMSG_DEVICE_FAIL", "open"), "start");
        assertEquals(List.of("beforeInit=[0, 0, true, -1]", "afterFailedStart=[0, true, -1, 0]", "openDevices=1"),
                child.reported("RESULT"), "events accepted, queries refused without the host, nothing sent");
        List<String> lines = child.reported("LINE");
        assertEquals(List.of(ON_LOAD, debug(INIT + ": called")), lines.subList(0, Math.min(2, lines.size())),
                "a failed start writes no returning line, and leaves the debug switch off");
        assertEquals(3, lines.size(), String.join("\n", lines));
        assertTrue(lines.get(2).matches("6\\|HCALL\\|.*hcallLibInitGuest failed, error -1"),
                "the connection failure goes through the logger at error level: " + lines.get(2));
        assertEquals(List.of(Wire.op(12).str("en-US").hex(), Wire.op(7).i32(1).hex(), Wire.op(18).str("late").hex()),
                child.reported("REQ"), "the waiting events reach the host in order once a start connects");
    }

    /**
     * Fault: the process could crash at exit when the connection was unmapped
     * under an exchange in progress, or the pool destroyed under its worker.
     */
    @ParameterizedTest
    @ValueSource(strings = {"exit", "end"})
    void Exit_WhileTheWorkerIsInsideAHostCall_EndsCleanly(String how) {
        ChildJvm child = ChildJvm.run(how.equals("exit") ? 5 : 0, ChildJvm.CLASS_PATH, Map.of(), "exit-busy", how);
        assertEquals(List.of("held=true", "workerLeftHost=true"), child.reported("RESULT"),
                "the worker was inside a host call and came out of it during the exit");
    }

    @Test
    void JniOnLoad_WhenTheServiceClassIsMissing_LogsTheFailureAndRefusesTheLoad() {
        ChildJvm child = ChildJvm.run(0, ChildJvm.classPathWithoutService(), Map.of(), "no-service");
        assertEquals(List.of("load=refused"), child.reported("RESULT"), "the JVM sees JNI_OnLoad's -1");
        assertEquals(List.of(ON_LOAD, error("ERROR: KivHostCallService native registration failed")),
                child.reported("LINE"));
    }
}
