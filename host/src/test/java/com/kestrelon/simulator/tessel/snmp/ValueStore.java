package com.kestrelon.simulator.tessel.snmp;

import java.util.Arrays;
import java.util.Map;
import java.util.concurrent.ConcurrentSkipListMap;

/**
 * Object values by OID, in OID order, stored as given: the memory of the handler the host-bridge
 * tests bind. Thread-safe: the engine reads it from many threads.
 */
public final class ValueStore {
  private final ConcurrentSkipListMap<int[], String> values =
      new ConcurrentSkipListMap<>(Arrays::compareUnsigned);

  /** Dotted OID text, with or without a leading dot; null when it is not an OID. */
  static int[] parse(String text) {
    if (text == null) {
      return null;
    }
    String body = text.startsWith(".") ? text.substring(1) : text;
    if (body.isEmpty()) {
      return new int[0];
    }
    String[] parts = body.split("\\.", -1);
    int[] oid = new int[parts.length];
    try {
      for (int i = 0; i < parts.length; i++) {
        oid[i] = Integer.parseUnsignedInt(parts[i]);
      }
    } catch (NumberFormatException e) {
      return null;
    }
    return oid;
  }

  public void put(String oidText, String value) {
    int[] oid = parse(oidText);
    if (oid != null && value != null) {
      values.put(oid, value);
    }
  }

  public String get(String oidText) {
    int[] oid = parse(oidText);
    return oid == null ? null : values.get(oid);
  }

  /**
   * The first object after column[.instance] of the entry that is still in that column, as
   * {value, column.instance relative to the entry}; null when the column has no more objects.
   */
  public String[] nextInColumn(String entryOid, int column, String instance) {
    int[] entry = parse(entryOid);
    int[] from = parse(entryOid + "." + Integer.toUnsignedString(column) + (instance == null ? "" : instance));
    if (entry == null || from == null) {
      return null;
    }
    Map.Entry<int[], String> next = values.higherEntry(from);
    int[] columnOid = Arrays.copyOf(entry, entry.length + 1);
    columnOid[entry.length] = column;
    if (next == null
        || next.getKey().length <= columnOid.length
        || !Arrays.equals(next.getKey(), 0, columnOid.length, columnOid, 0, columnOid.length)) {
      return null;
    }
    StringBuilder relative = new StringBuilder();
    for (int i = entry.length; i < next.getKey().length; i++) {
      if (relative.length() > 0) {
        relative.append('.');
      }
      relative.append(Integer.toUnsignedString(next.getKey()[i]));
    }
    return new String[] {next.getValue(), relative.toString()};
  }
}
