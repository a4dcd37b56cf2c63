package com.kestrelon.simulator.tessel.data;

import java.math.BigInteger;
import java.nio.ByteBuffer;

/**
 * The Opaque-wrapped numbers of net-snmp: the Opaque octets hold an inner BER item with a
 * two-octet tag, {@code 9f 78} float (4 octets IEEE 754), {@code 9f 79} double (8 octets),
 * {@code 9f 7a} int64, {@code 9f 7b} uint64, {@code 9f 76} counter64 (minimal two's-complement
 * octets, a leading zero octet keeping unsigned values positive), then a length and the value.
 * Stateless.
 */
final class OpaqueValues {
    private static final int FLOAT = 0x78;
    private static final int DOUBLE = 0x79;
    private static final int INT64 = 0x7a;
    private static final int UINT64 = 0x7b;
    private static final int COUNTER64 = 0x76;
    private static final BigInteger MAX_UNSIGNED_64 = BigInteger.ONE.shiftLeft(64).subtract(BigInteger.ONE);

    private OpaqueValues() {
    }

    static byte[] ofFloat(float value) {
        return wrap(FLOAT, ByteBuffer.allocate(4).putFloat(value).array());
    }

    static byte[] ofDouble(double value) {
        return wrap(DOUBLE, ByteBuffer.allocate(8).putDouble(value).array());
    }

    static byte[] ofInt64(long value) {
        return wrap(INT64, BigInteger.valueOf(value).toByteArray());
    }

    static byte[] ofUInt64(BigInteger value) {
        return wrap(UINT64, unsigned(value));
    }

    static byte[] ofCounter64(BigInteger value) {
        return wrap(COUNTER64, unsigned(value));
    }

    private static byte[] unsigned(BigInteger value) {
        if (value.signum() < 0 || value.compareTo(MAX_UNSIGNED_64) > 0) {
            throw new IllegalArgumentException("out of the unsigned 64-bit range: " + value);
        }
        return value.toByteArray();
    }

    private static byte[] wrap(int innerTag, byte[] value) {
        byte[] out = new byte[3 + value.length];
        out[0] = (byte) 0x9f;
        out[1] = (byte) innerTag;
        out[2] = (byte) value.length;
        System.arraycopy(value, 0, out, 3, value.length);
        return out;
    }
}
