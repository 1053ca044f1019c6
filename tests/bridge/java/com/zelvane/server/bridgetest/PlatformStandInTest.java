package com.zelvane.server.bridgetest;

import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;

import java.io.File;
import java.util.Arrays;
import java.util.List;
import java.util.Map;
import java.util.stream.Collectors;
import org.junit.jupiter.api.BeforeAll;
import org.junit.jupiter.api.Test;

/** The libandroid_runtime stand-in's registration, in the real JVM. */
class PlatformStandInTest {
    static final String HELPER = "com/zelvane/server/bridgetest/TestNative";

    @BeforeAll
    static void load() {
        Bridge.load();
    }

    @Test
    void RegisterNativeMethods_WhenClassAndMethodExist_BindsThem() {
        assertArrayEquals(new int[] {0, 0}, TestNative.register(HELPER, "boundLater", "()I"));
        assertEquals(42, TestNative.boundLater(), "the call reaches the bound function");
    }

    @Test
    void RegisterNativeMethods_WhenClassOrMethodIsMissing_FailsWithNoExceptionPending() {
        int[] noClass = TestNative.register("com/zelvane/server/NoSuchService", "boundLater", "()I");
        int[] noMethod = TestNative.register(HELPER, "noSuchMethod", "()I");
        assertEquals(0, noClass[1], "no exception left pending for a missing class");
        assertEquals(0, noMethod[1], "no exception left pending for a missing method");
        assertEquals(true, noClass[0] != 0 && noMethod[0] != 0, "both report failure");
    }

    @Test
    void JniOnLoad_WhenTheServiceClassIsMissing_LogsTheFailureAndRefusesTheLoad() {
        String withoutService = Arrays.stream(System.getProperty("java.class.path").split(File.pathSeparator))
                .filter(entry -> !entry.endsWith("kivhostcall-service.jar"))
                .collect(Collectors.joining(File.pathSeparator));
        ChildJvm child = ChildJvm.run(NoServiceClass.class.getName(), withoutService, "", Map.of()).assertClean(0);
        assertEquals(List.of("load=refused"), child.reported("RESULT"), "the JVM sees JNI_OnLoad's -1");
        assertEquals(List.of("4|" + Bridge.TAG + "|jint JNI_OnLoad(JavaVM *, void *) called",
                        "6|" + Bridge.TAG + "|ERROR: KivHostCallService native registration failed"),
                child.reported("LINE"), "the entry line, then the registration failure at error priority");
    }
}
