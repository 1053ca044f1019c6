package com.zelvane.server.bridgetest;

import java.io.ByteArrayOutputStream;
import java.io.DataOutputStream;
import java.io.IOException;
import java.util.Arrays;

/** A host-call request as the host must receive it, written from Java values. */
final class Wire {
    private final ByteArrayOutputStream fields = new ByteArrayOutputStream();
    private final int opCode;

    private Wire(int opCode) {
        this.opCode = opCode;
    }

    static Wire op(int opCode) {
        return new Wire(opCode);
    }

    /** Count, then the modified UTF-8 bytes Java hands to JNI, then NUL. */
    Wire str(String value) {
        try {
            ByteArrayOutputStream utf = new ByteArrayOutputStream();
            new DataOutputStream(utf).writeUTF(value);
            byte[] bytes = Arrays.copyOfRange(utf.toByteArray(), 2, utf.size());
            i32(bytes.length + 1);
            fields.write(bytes);
            fields.write(0);
            return this;
        } catch (IOException e) {
            throw new AssertionError(e);
        }
    }

    Wire i32(int value) {
        for (int i = 0; i < 4; i++) fields.write(value >>> (8 * i));
        return this;
    }

    Wire bool(boolean value) {
        return i32(value ? 1 : 0);
    }

    /** Header (operation code, total length), then the fields, as hex. */
    String hex() {
        Wire whole = op(0).i32(opCode).i32(8 + fields.size());
        StringBuilder text = new StringBuilder();
        for (byte b : whole.fields.toByteArray()) text.append(String.format("%02x", b & 0xFF));
        for (byte b : fields.toByteArray()) text.append(String.format("%02x", b & 0xFF));
        return text.toString();
    }
}
