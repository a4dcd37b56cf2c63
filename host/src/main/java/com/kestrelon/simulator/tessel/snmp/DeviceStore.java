package com.kestrelon.simulator.tessel.snmp;

import com.kestrelon.simulator.tessel.data.DeviceData;
import com.kestrelon.simulator.tessel.data.DeviceObject;
import com.kestrelon.simulator.tessel.data.Oid;
import com.kestrelon.simulator.tessel.data.ValueText;
import java.util.Arrays;
import java.util.HashMap;
import java.util.List;
import java.util.Map;
import java.util.concurrent.ConcurrentHashMap;

/**
 * The values of every simulated device: one shared, immutable copy of the recorded objects, and
 * per agent an overlay of the values Sets have changed on that device alone. Every device starts
 * from the same data; the overlay of an agent is created on its first Set.
 *
 * <p>OID texts are the engine's: a dot before each sub-identifier ({@code .1.3.6.1.2.1.1.5.0}).
 * Values are engine texts as {@link ValueText} describes them. An exact lookup costs one hash
 * lookup, a column walk step one binary search over the objects of its table. Thread-safe: the
 * engine calls in from many request threads at once.
 */
public final class DeviceStore {
  private final List<DeviceObject> objects;
  private final Oid[] oids;
  private final Map<String, Integer> positionByText;
  /** Per entry OID text: the range of objects below it, found on first use. */
  private final Map<String, EntryRange> entries = new ConcurrentHashMap<>();
  /** Per agent id: object position to the value a Set stored. */
  private final Map<Integer, Map<Integer, String>> overlays = new ConcurrentHashMap<>();

  /** The objects below one table entry: positions [first, end), entry of {@code length} sub-ids. */
  private record EntryRange(Oid entry, int first, int end) {
    int length() {
      return entry.length();
    }
  }

  public DeviceStore(DeviceData data) {
    this(data.objects());
  }

  private DeviceStore(List<DeviceObject> sorted) {
    objects = sorted;
    oids = sorted.stream().map(DeviceObject::oid).toArray(Oid[]::new);
    Map<String, Integer> positions = new HashMap<>(sorted.size() * 2);
    for (int i = 0; i < oids.length; i++) {
      positions.put(oids[i].toDottedText(), i);
    }
    positionByText = positions;
  }

  /** A store without objects: every lookup finds nothing and every Set is refused. */
  public static DeviceStore empty() {
    return new DeviceStore(List.of());
  }

  /** The value the agent serves for the object with this OID text, or null when there is none. */
  public String get(int agentId, String oidText) {
    Integer position = positionByText.get(oidText);
    return position == null ? null : valueAt(agentId, position);
  }

  /**
   * The first object of {@code column} of the table entry whose instance follows {@code instance}
   * (from the column's start when null), as {value, "column.instance" relative to the entry};
   * null when the column has no object after it.
   *
   * @param instance the instance with a dot before each sub-identifier ({@code .1.5}), or null
   */
  public String[] nextInColumn(int agentId, String entryOid, int column, String instance) {
    EntryRange range = entryRange(entryOid);
    Oid key = range == null ? null : columnKey(range.entry(), column, instance);
    if (key == null) {
      return null;
    }
    int found = Arrays.binarySearch(oids, range.first, range.end, key);
    int position = found >= 0 ? found + 1 : -found - 1;
    if (position == range.end || oids[position].get(range.length()) != Integer.toUnsignedLong(column)) {
      return null;
    }
    return new String[] {valueAt(agentId, position), oids[position].suffixText(range.length())};
  }

  /**
   * Stores a Set value for one agent: the canonical text of {@code valueText} for the object's type
   * (octet texts {@code 'hex'h} are read as hex). Other agents keep their values.
   *
   * @return the stored text, or null when the data has no object with this OID
   * @throws IllegalArgumentException when the text is not a value of the object's type
   */
  public String set(int agentId, String oidText, String valueText) {
    Integer position = positionByText.get(oidText);
    if (position == null) {
      return null;
    }
    String canonical = ValueText.canonical(objects.get(position).type(), valueText);
    overlays.computeIfAbsent(agentId, id -> new ConcurrentHashMap<>()).put(position, canonical);
    return canonical;
  }

  private String valueAt(int agentId, int position) {
    if (!overlays.isEmpty()) {
      Map<Integer, String> overlay = overlays.get(agentId);
      String changed = overlay == null ? null : overlay.get(position);
      if (changed != null) {
        return changed;
      }
    }
    return objects.get(position).value();
  }

  private EntryRange entryRange(String entryOid) {
    EntryRange known = entries.get(entryOid);
    if (known != null) {
      return known;
    }
    Oid entry;
    try {
      entry = Oid.parse(entryOid);
    } catch (IllegalArgumentException e) {
      return null;
    }
    int found = Arrays.binarySearch(oids, entry);
    int first = found >= 0 ? found : -found - 1;
    int end = first;
    while (end < oids.length && oids[end].startsWith(entry)) {
      end++;
    }
    EntryRange range = new EntryRange(entry, first, end);
    entries.putIfAbsent(entryOid, range);
    return range;
  }

  /**
   * The OID of the entry's column followed by the instance: where a column walk stands. Null when
   * the instance is malformed. Only the instance is parsed: the walk's hot path.
   */
  private static Oid columnKey(Oid entry, int column, String instance) {
    String suffix = instance == null ? "" : instance;
    if (!suffix.isEmpty() && suffix.charAt(0) != '.') {
      return null;
    }
    try {
      Oid rest = suffix.isEmpty() ? null : Oid.parse(suffix);
      long[] more = new long[1 + (rest == null ? 0 : rest.length())];
      more[0] = Integer.toUnsignedLong(column);
      for (int i = 1; i < more.length; i++) {
        more[i] = rest.get(i - 1);
      }
      return entry.append(more);
    } catch (IllegalArgumentException e) {
      return null;
    }
  }
}
