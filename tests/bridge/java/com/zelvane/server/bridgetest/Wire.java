package com.zelvane.server.bridgetest;

import java.io.ByteArrayOutputStream;
import java.io.DataOutputStream;
import java.io.IOException;

/** Host-call requests as the host must receive them, built from Java values. */
final class Wire {
    private final ByteArrayOutputStream fields = new ByteArrayOutputStream();
    private final int opCode;

    private Wire(int opCode) {
        this.opCode = opCode;
    }

    static Wire op(int opCode) {
        return new Wire(opCode);
    }

    /** A string field: count, then the modified UTF-8 bytes Java hands to JNI, then NUL. */
    Wire str(String value) {
        byte[] bytes = modifiedUtf8(value);
        i32(bytes.length + 1);
        fields.write(bytes, 0, bytes.length);
        fields.write(0);
        return this;
    }

    Wire i32(int value) {
        for (int i = 0; i < 4; i++) fields.write((value >>> (8 * i)) & 0xFF);
        return this;
    }

    Wire bool(boolean value) {
        return i32(value ? 1 : 0);
    }

    byte[] bytes() {
        byte[] body = fields.toByteArray();
        Wire whole = new Wire(0);
        whole.i32(opCode).i32(8 + body.length);
        whole.fields.write(body, 0, body.length);
        return whole.fields.toByteArray();
    }

    static byte[] modifiedUtf8(String value) {
        try {
            ByteArrayOutputStream out = new ByteArrayOutputStream();
            new DataOutputStream(out).writeUTF(value);
            byte[] withLength = out.toByteArray();
            return java.util.Arrays.copyOfRange(withLength, 2, withLength.length);
        } catch (IOException e) {
            throw new AssertionError(e);
        }
    }

    static String hex(byte[] bytes) {
        StringBuilder text = new StringBuilder();
        for (byte b : bytes) text.append(String.format("%02x", b & 0xFF));
        return text.toString();
    }
}
