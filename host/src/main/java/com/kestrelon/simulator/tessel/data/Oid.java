package com.kestrelon.simulator.tessel.data;

import java.util.Arrays;

/**
 * An object identifier: 1 to {@value #MAX_LENGTH} sub-identifiers, each an unsigned 32-bit value.
 *
 * <p>Ordering compares sub-identifier by sub-identifier as unsigned numbers; a proper prefix sorts
 * first. {@link #toString()} gives the dotted text without a leading dot ({@code 1.3.6.1}),
 * {@link #toDottedText()} the form with one ({@code .1.3.6.1}). Immutable and thread-safe.
 */
public final class Oid implements Comparable<Oid> {
    /** The most sub-identifiers an object identifier may have. */
    public static final int MAX_LENGTH = 128;

    private final int[] subIds;

    private Oid(int[] subIds) {
        this.subIds = subIds;
    }

    /**
     * Parses dotted decimal text, with or without a leading dot.
     *
     * @throws IllegalArgumentException when the text is not an object identifier
     */
    public static Oid parse(String text) {
        String body = text.startsWith(".") ? text.substring(1) : text;
        if (body.isEmpty()) {
            throw new IllegalArgumentException("empty object identifier");
        }
        String[] parts = body.split("\\.", -1);
        if (parts.length > MAX_LENGTH) {
            throw new IllegalArgumentException("object identifier longer than " + MAX_LENGTH + " sub-identifiers");
        }
        int[] ids = new int[parts.length];
        for (int i = 0; i < parts.length; i++) {
            ids[i] = parseSubId(parts[i], text);
        }
        return new Oid(ids);
    }

    private static int parseSubId(String part, String whole) {
        if (part.isEmpty() || part.length() > 10 || !part.chars().allMatch(c -> c >= '0' && c <= '9')) {
            throw new IllegalArgumentException("malformed object identifier '" + whole + "'");
        }
        long value = Long.parseLong(part);
        if (value > 0xFFFF_FFFFL) {
            throw new IllegalArgumentException("sub-identifier " + part + " exceeds 4294967295");
        }
        return (int) value;
    }

    /** An object identifier from sub-identifiers given as unsigned values (0 to 2^32-1). */
    public static Oid of(long... subIds) {
        if (subIds.length == 0 || subIds.length > MAX_LENGTH) {
            throw new IllegalArgumentException("an object identifier has 1 to " + MAX_LENGTH + " sub-identifiers");
        }
        int[] ids = new int[subIds.length];
        for (int i = 0; i < subIds.length; i++) {
            if (subIds[i] < 0 || subIds[i] > 0xFFFF_FFFFL) {
                throw new IllegalArgumentException("sub-identifier out of range: " + subIds[i]);
            }
            ids[i] = (int) subIds[i];
        }
        return new Oid(ids);
    }

    public int length() {
        return subIds.length;
    }

    /** The sub-identifier at {@code index} as an unsigned value. */
    public long get(int index) {
        return Integer.toUnsignedLong(subIds[index]);
    }

    /** The last sub-identifier as an unsigned value. */
    public long last() {
        return get(subIds.length - 1);
    }

    /** The first {@code count} sub-identifiers (1 to length). */
    public Oid prefix(int count) {
        if (count < 1 || count > subIds.length) {
            throw new IllegalArgumentException("prefix length " + count + " of " + this);
        }
        return count == subIds.length ? this : new Oid(Arrays.copyOf(subIds, count));
    }

    /** This identifier followed by {@code more}. */
    public Oid append(long... more) {
        long[] all = new long[subIds.length + more.length];
        for (int i = 0; i < subIds.length; i++) {
            all[i] = get(i);
        }
        System.arraycopy(more, 0, all, subIds.length, more.length);
        return of(all);
    }

    /** True when this identifier equals {@code prefix} or lies in the sub-tree below it. */
    public boolean startsWith(Oid prefix) {
        if (prefix.subIds.length > subIds.length) {
            return false;
        }
        return Arrays.equals(subIds, 0, prefix.subIds.length, prefix.subIds, 0, prefix.subIds.length);
    }

    /** The dotted text of the sub-identifiers from {@code from} on, without a leading dot ("" when none). */
    public String suffixText(int from) {
        StringBuilder text = new StringBuilder();
        for (int i = from; i < subIds.length; i++) {
            if (i > from) {
                text.append('.');
            }
            text.append(Integer.toUnsignedString(subIds[i]));
        }
        return text.toString();
    }

    /** Dotted text with a leading dot, the form the engine uses for OID values. */
    public String toDottedText() {
        return "." + this;
    }

    @Override
    public String toString() {
        return suffixText(0);
    }

    @Override
    public int compareTo(Oid other) {
        return Arrays.compareUnsigned(subIds, other.subIds);
    }

    @Override
    public boolean equals(Object other) {
        return other instanceof Oid o && Arrays.equals(subIds, o.subIds);
    }

    @Override
    public int hashCode() {
        return Arrays.hashCode(subIds);
    }
}
