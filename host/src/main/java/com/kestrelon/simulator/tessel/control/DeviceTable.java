package com.kestrelon.simulator.tessel.control;

import com.kestrelon.simulator.tessel.data.ValueText;
import com.kestrelon.simulator.tessel.network.Network;
import java.nio.ByteBuffer;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.Comparator;
import java.util.EnumMap;
import java.util.HashMap;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Map;
import java.util.Optional;

/**
 * Every device of a running network in address order, with the state of each of its protocols'
 * agents, and the switch that opens and closes them one device at a time. Thread-safe: the
 * control interface reads and changes it from its request threads; one lock serialises every
 * change with the engine calls it makes, so a device's state is always what its agents do.
 */
public final class DeviceTable {
  private final Entry[] entries; // by address
  private final long[] addresses; // entries[i].address, for binary search
  private final Map<String, ProtocolAgents> agents;

  /**
   * A device's fixed identity and its agents' states (guarded by the table). A network holds tens
   * of thousands: the protocol names are one array shared by the devices that have the same ones,
   * the states an array beside it.
   */
  private static final class Entry {
    final long address;
    final int agentId;
    final String name;
    final String group;
    final List<String> protocols;
    final AgentState[] states;

    Entry(long address, int agentId, String name, String group, List<String> protocols, AgentState[] states) {
      this.address = address;
      this.agentId = agentId;
      this.name = name;
      this.group = group;
      this.protocols = protocols;
      this.states = states;
    }

    AgentState state(String protocol) {
      int index = protocols.indexOf(protocol);
      return index < 0 ? null : states[index];
    }

    void set(String protocol, AgentState state) {
      states[protocols.indexOf(protocol)] = state;
    }

    boolean any(AgentState state) {
      return Arrays.asList(states).contains(state);
    }

    Map<String, AgentState> stateMap() {
      Map<String, AgentState> map = new LinkedHashMap<>();
      for (int i = 0; i < states.length; i++) {
        map.put(protocols.get(i), states[i]);
      }
      return map;
    }
  }

  /** A page of devices: how many match in all, and those of the page. */
  public record Page(int total, List<Device> devices) {}

  /** The device after a change, and why a start failed (empty when every start succeeded). */
  public record Change(Device device, Optional<String> failure) {}

  /** The devices as they start; add them in any order. */
  public static final class Builder {
    private final List<Entry> entries = new ArrayList<>();
    private final Map<List<String>, List<String>> protocolLists = new HashMap<>();

    public Builder add(long address, int agentId, String name, String group, Map<String, AgentState> states) {
      List<String> protocols = List.copyOf(states.keySet());
      protocols = protocolLists.computeIfAbsent(protocols, list -> list);
      entries.add(new Entry(address, agentId, name, group, protocols, states.values().toArray(new AgentState[0])));
      return this;
    }

    /** The table whose agents of protocol p the agents.get(p) opens and closes. */
    public DeviceTable build(Map<String, ProtocolAgents> agents) {
      return new DeviceTable(entries, agents);
    }
  }

  private DeviceTable(List<Entry> list, Map<String, ProtocolAgents> agents) {
    entries = list.stream().sorted(Comparator.comparingLong(entry -> entry.address)).toArray(Entry[]::new);
    addresses = Arrays.stream(entries).mapToLong(entry -> entry.address).toArray();
    this.agents = Map.copyOf(agents);
  }

  public int size() {
    return entries.length;
  }

  /** The device at a dotted IPv4 address, in any spelling the address parser accepts. */
  public synchronized Optional<Device> find(String address) {
    return entry(address).map(DeviceTable::snapshot);
  }

  /**
   * The devices of {@code group} (null: any) with a protocol in {@code state} (null: any), from
   * position {@code offset} of that selection, at most {@code limit} of them.
   */
  public synchronized Page query(String group, AgentState state, int offset, int limit) {
    List<Device> page = new ArrayList<>();
    int total = 0;
    for (Entry entry : entries) {
      if ((group == null || entry.group.equals(group)) && (state == null || entry.any(state))) {
        if (total >= offset && page.size() < limit) {
          page.add(snapshot(entry));
        }
        total++;
      }
    }
    return new Page(total, page);
  }

  /** Per group (in address order), per protocol, how many devices are in each state. */
  public synchronized Map<String, Map<String, EnumMap<AgentState, Integer>>> counts() {
    Map<String, Map<String, EnumMap<AgentState, Integer>>> counts = new LinkedHashMap<>();
    for (Entry entry : entries) {
      Map<String, EnumMap<AgentState, Integer>> group = counts.computeIfAbsent(entry.group, g -> new LinkedHashMap<>());
      for (int i = 0; i < entry.states.length; i++) {
        group.computeIfAbsent(entry.protocols.get(i), p -> zeroCounts()).merge(entry.states[i], 1, Integer::sum);
      }
    }
    return counts;
  }

  /** How many devices have every protocol running. */
  public synchronized int running() {
    int running = 0;
    for (Entry entry : entries) {
      running += Arrays.stream(entry.states).allMatch(state -> state == AgentState.RUNNING) ? 1 : 0;
    }
    return running;
  }

  /**
   * Closes the agents of the device (of every protocol, or of {@code protocol} alone). Empty when
   * there is no such device; IllegalArgumentException when the device has no such protocol.
   */
  public synchronized Optional<Change> stop(String address, Optional<String> protocol) {
    Optional<Entry> entry = entry(address);
    if (entry.isEmpty()) {
      return Optional.empty();
    }
    for (String name : protocols(entry.get(), protocol)) {
      if (entry.get().state(name) == AgentState.RUNNING) {
        agents.get(name).stop(snapshot(entry.get()));
      }
      entry.get().set(name, AgentState.STOPPED);
    }
    return Optional.of(new Change(snapshot(entry.get()), Optional.empty()));
  }

  /**
   * Opens the agents of the device that do not run (of every protocol, or of {@code protocol}
   * alone); an agent that cannot open is left failed and its reason returned.
   */
  public synchronized Optional<Change> start(String address, Optional<String> protocol) {
    Optional<Entry> entry = entry(address);
    if (entry.isEmpty()) {
      return Optional.empty();
    }
    List<String> failures = new ArrayList<>();
    for (String name : protocols(entry.get(), protocol)) {
      if (entry.get().state(name) == AgentState.RUNNING) {
        continue;
      }
      Optional<String> failure = agents.get(name).start(snapshot(entry.get()));
      entry.get().set(name, failure.isEmpty() ? AgentState.RUNNING : AgentState.FAILED);
      failure.ifPresent(reason -> failures.add(name + ": " + reason));
    }
    Optional<String> failure = failures.isEmpty() ? Optional.empty() : Optional.of(String.join("; ", failures));
    return Optional.of(new Change(snapshot(entry.get()), failure));
  }

  /** Stops, then starts, the device's agents. */
  public synchronized Optional<Change> restart(String address, Optional<String> protocol) {
    return stop(address, protocol).flatMap(stopped -> start(address, protocol));
  }

  private List<String> protocols(Entry entry, Optional<String> protocol) {
    if (protocol.isEmpty()) {
      return entry.protocols;
    }
    if (!entry.protocols.contains(protocol.get())) {
      throw new IllegalArgumentException("device " + Network.dotted(entry.address) + " has no " + protocol.get()
          + " agent (it has " + String.join(", ", entry.protocols) + ")");
    }
    return List.of(protocol.get());
  }

  private Optional<Entry> entry(String address) {
    long value;
    try {
      value = Integer.toUnsignedLong(ByteBuffer.wrap(ValueText.parseIpAddress(address)).getInt());
    } catch (IllegalArgumentException e) {
      return Optional.empty();
    }
    int position = Arrays.binarySearch(addresses, value);
    return position < 0 ? Optional.empty() : Optional.of(entries[position]);
  }

  private static Device snapshot(Entry entry) {
    return new Device(Network.dotted(entry.address), entry.address, entry.agentId, entry.name, entry.group,
        entry.stateMap());
  }

  private static EnumMap<AgentState, Integer> zeroCounts() {
    EnumMap<AgentState, Integer> counts = new EnumMap<>(AgentState.class);
    for (AgentState state : AgentState.values()) {
      counts.put(state, 0);
    }
    return counts;
  }
}
