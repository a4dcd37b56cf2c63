package com.kestrelon.simulator.tessel.snmp;

import com.kestrelon.simulator.tessel.control.Device;
import com.kestrelon.simulator.tessel.control.ProtocolAgents;
import com.kestrelon.simulator.tessel.data.CellDefinition;
import com.kestrelon.simulator.tessel.data.DeviceData;
import com.kestrelon.simulator.tessel.data.DeviceDataException;
import com.kestrelon.simulator.tessel.data.MibLayout;
import com.kestrelon.simulator.tessel.network.Network;
import com.kestrelon.simulator.tessel.network.Network.Group;
import com.kestrelon.simulator.tessel.network.Network.Snmp;
import com.kestrelon.simulator.tessel.network.Network.TrapSink;
import java.io.IOException;
import java.nio.file.NoSuchFileException;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Map;
import java.util.Optional;

/**
 * The SNMP agents of a network: the device data and SNMPv3 rows its groups use, loaded and checked
 * before the engine starts, then registered with the engine, and the agents opened group by group
 * and later one device at a time. Device i of a group is agent {@code firstAgentId(group) + i},
 * the id the network gives the device for all its protocols. Groups that share a data file share
 * its values (each agent still keeps its own Sets).
 */
public final class SnmpNetwork implements ProtocolAgents {
  /** The engine boots every agent starts with. */
  private static final int ENGINE_BOOTS = 1;

  private final List<Group> groups;
  private final int[] firstAgentIds;
  private final DeviceStore[] stores; // per group
  private final Map<String, Integer> portByGroup = new LinkedHashMap<>();
  private final List<CellDefinition> cells;
  private final List<SnmpV3Config> snmpV3;
  private final SnmpHandler handler;
  private final List<TrapSink> networkSinks;

  /** A data or SNMPv3 file that cannot be read: the file and why. */
  public static final class FileException extends Exception {
    private static final long serialVersionUID = 1L;

    FileException(String message) {
      super(message);
    }
  }

  private SnmpNetwork(List<Group> groups, int[] firstAgentIds, Map<Path, DeviceData> data,
      List<SnmpV3Config> snmpV3, List<TrapSink> networkSinks) throws DeviceDataException {
    this.groups = groups;
    this.networkSinks = networkSinks;
    this.snmpV3 = snmpV3;
    this.firstAgentIds = firstAgentIds;
    stores = new DeviceStore[groups.size()];
    Map<Path, DeviceStore> storeByFile = new LinkedHashMap<>();
    for (int g = 0; g < groups.size(); g++) {
      Snmp snmp = groups.get(g).snmp().orElseThrow();
      stores[g] = storeByFile.computeIfAbsent(snmp.data(), file -> new DeviceStore(data.get(file)));
      portByGroup.put(groups.get(g).name(), snmp.port());
    }
    // One MIB tree serves every agent: its cells come from the objects of all the data files.
    cells = MibLayout.infer(DeviceData.union(List.copyOf(data.values())));
    handler = new SnmpHandler(this::store);
  }

  /** Reads and checks the data and SNMPv3 files of the network's SNMP groups. */
  public static SnmpNetwork load(Network network)
      throws FileException, DeviceDataException, SnmpV3ConfigException {
    List<Group> groups = network.groups().stream().filter(group -> group.snmp().isPresent()).toList();
    Map<Path, DeviceData> data = new LinkedHashMap<>();
    Map<Path, SnmpV3Config> snmpV3 = new LinkedHashMap<>();
    for (Group group : groups) {
      Snmp snmp = group.snmp().orElseThrow();
      if (!data.containsKey(snmp.data())) {
        data.put(snmp.data(), read(snmp.data(), () -> DeviceData.load(snmp.data())));
      }
      Optional<Path> v3 = snmp.v3();
      if (v3.isPresent() && !snmpV3.containsKey(v3.get())) {
        snmpV3.put(v3.get(), read(v3.get(), () -> SnmpV3Config.load(v3.get())));
      }
    }
    int[] firstAgentIds = groups.stream().mapToInt(network::firstAgentId).toArray();
    return new SnmpNetwork(groups, firstAgentIds, data, List.copyOf(snmpV3.values()), network.trapSinks());
  }

  private interface Reader<T> {
    T read() throws IOException, DeviceDataException, SnmpV3ConfigException;
  }

  private static <T> T read(Path file, Reader<T> reader)
      throws FileException, DeviceDataException, SnmpV3ConfigException {
    try {
      return reader.read();
    } catch (NoSuchFileException e) {
      throw new FileException(file + ": no such file");
    } catch (IOException e) {
      throw new FileException(file + ": cannot be read: " + e.getMessage());
    }
  }

  public SnmpHandler handler() {
    return handler;
  }

  /** The number of SNMP devices. */
  public int devices() {
    return groups.stream().mapToInt(Group::count).sum();
  }

  public List<Group> groups() {
    return groups;
  }

  public int firstAgentId(int group) {
    return firstAgentIds[group];
  }

  /**
   * Gives the engine the SNMPv3 rows and the MIB tree; call after {@code jniJVMparams}, whose engine
   * ID the rows go under. Returns what the engine refused, or empty.
   */
  public Optional<String> register() throws SnmpV3ConfigException {
    for (SnmpV3Config config : snmpV3) {
      config.apply(new SerToCConverter());
    }
    SnmpRegister register = new SnmpRegister();
    for (CellDefinition cell : cells) {
      int count = cell.subIds().size();
      if (!register.JniCreateTreeCell(cell.label(), null, "V2", "." + cell.oid(), count,
          cell.subIds().toArray(String[]::new), cell.dataTypes().toArray(String[]::new),
          cell.accessTexts().toArray(String[]::new), cell.isTable(), cell.rowStatusColumn(), null)) {
        return Optional.of("the engine refused the objects registered at " + cell.oid());
      }
    }
    return registerTrapSinks();
  }

  /** Each group's devices send their standard traps to the network's sinks and the group's own. */
  private Optional<String> registerTrapSinks() {
    SnmpTrapService engine = null;
    for (int g = 0; g < groups.size(); g++) {
      List<TrapSink> sinks = new ArrayList<>(networkSinks);
      sinks.addAll(groups.get(g).trapSinks());
      if (sinks.isEmpty()) {
        continue;
      }
      engine = engine == null ? new SnmpTrapService() : engine;
      int refused = engine.setTrapSinks(firstAgentIds[g], groups.get(g).count(),
          sinks.stream().mapToInt(TrapSink::versionNumber).toArray(),
          sinks.stream().map(TrapSink::address).toArray(String[]::new),
          sinks.stream().mapToInt(TrapSink::port).toArray(),
          sinks.stream().map(TrapSink::community).toArray(String[]::new),
          sinks.stream().map(TrapSink::user).toArray(String[]::new),
          sinks.stream().map(TrapSink::context).toArray(String[]::new),
          sinks.stream().mapToInt(sink -> sink.inform() ? 1 : 0).toArray(),
          sinks.stream().mapToInt(TrapSink::timeout).toArray(),
          sinks.stream().mapToInt(TrapSink::retries).toArray());
      if (refused >= 0) {
        return Optional.of("trap sink " + sinks.get(refused).address() + " of group " + groups.get(g).name()
            + " does not resolve");
      }
      if (refused != -1) {
        return Optional.of("the engine refused the trap sinks of group " + groups.get(g).name());
      }
    }
    return Optional.empty();
  }

  /** Registers and opens devices [first, first + count) of a group; true where one opened. */
  public boolean[] startAgents(int group, int first, int count) {
    Group of = groups.get(group);
    Snmp snmp = of.snmp().orElseThrow();
    int[] agentIds = new int[count];
    String[] tableNames = new String[count];
    String[] addresses = new String[count];
    for (int i = 0; i < count; i++) {
      agentIds[i] = firstAgentIds[group] + first + i;
      tableNames[i] = "device" + agentIds[i];
      addresses[i] = of.address(first + i);
    }
    // The engine splits a community text at ',': the write community also reads.
    int[] sockets = handler.startSnmpNetwork(agentIds, tableNames, addresses, filled(count, snmp.port()),
        filled(count, snmp.readCommunity() + "," + snmp.writeCommunity()), filled(count, snmp.writeCommunity()),
        filled(count, ENGINE_BOOTS), String.valueOf(snmp.data().getFileName()), new int[count]);
    boolean[] opened = new boolean[count];
    for (int i = 0; sockets != null && i < count; i++) {
      opened[i] = sockets[i] > 0;
    }
    return opened;
  }

  /**
   * The engine forgets an agent it stops, and keeps none that failed to open: a device starts
   * again by registering its agent anew, under the same agent id, so that it keeps its Sets.
   */
  @Override
  public Optional<String> start(Device device) {
    int group = groupOf(device.agentId());
    return startAgents(group, device.agentId() - firstAgentIds[group], 1)[0] ? Optional.empty()
        : Optional.of("the SNMP agent cannot open UDP port " + portByGroup.get(device.group()) + " on " + device.address()
            + " (is another program using it?)");
  }

  @Override
  public void stop(Device device) {
    handler.stopAgent(device.address(), portByGroup.get(device.group()));
  }

  private DeviceStore store(int agentId) {
    return stores[Math.max(0, groupOf(agentId))];
  }

  /** The group whose agent ids hold agentId (-1 below the first). */
  private int groupOf(int agentId) {
    int position = Arrays.binarySearch(firstAgentIds, agentId);
    return position >= 0 ? position : -position - 2;
  }

  private static int[] filled(int count, int value) {
    int[] array = new int[count];
    Arrays.fill(array, value);
    return array;
  }

  private static String[] filled(int count, String value) {
    String[] array = new String[count];
    Arrays.fill(array, value);
    return array;
  }
}
