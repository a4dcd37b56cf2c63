package com.kestrelon.simulator.tessel.data;

/**
 * The SNMP value types a device's objects may have, each with its BER tag number (the number the
 * engine and the {@code .snmprec} format use). Immutable.
 */
public enum BerType {
    INTEGER(2),
    BIT_STRING(3),
    OCTET_STRING(4),
    NULL(5),
    OBJECT_IDENTIFIER(6),
    IP_ADDRESS(64),
    COUNTER32(65),
    GAUGE32(66),
    TIME_TICKS(67),
    OPAQUE(68),
    NSAP_ADDRESS(69),
    COUNTER64(70),
    UINTEGER32(71);

    private final int number;

    BerType(int number) {
        this.number = number;
    }

    /** The BER tag number, e.g. 4 for OCTET STRING. */
    public int number() {
        return number;
    }

    /** True for the types whose value is a string of octets: OCTET STRING, BIT STRING, Opaque, NsapAddress. */
    public boolean isOctets() {
        return this == OCTET_STRING || this == BIT_STRING || this == OPAQUE || this == NSAP_ADDRESS;
    }

    /** True for Counter32, Gauge32, TimeTicks and UInteger32: unsigned 32-bit numbers. */
    public boolean isUnsigned32() {
        return this == COUNTER32 || this == GAUGE32 || this == TIME_TICKS || this == UINTEGER32;
    }

    /** The type with BER tag {@code number}, or {@code null} when no type has it. */
    public static BerType fromNumber(int number) {
        for (BerType type : values()) {
            if (type.number == number) {
                return type;
            }
        }
        return null;
    }
}
