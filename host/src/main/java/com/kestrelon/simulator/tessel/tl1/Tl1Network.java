package com.kestrelon.simulator.tessel.tl1;

import com.kestrelon.simulator.tessel.control.Device;
import com.kestrelon.simulator.tessel.control.ProtocolAgents;
import com.kestrelon.simulator.tessel.network.Network;
import com.kestrelon.simulator.tessel.network.Network.Group;
import com.kestrelon.simulator.tessel.network.Network.Tl1;
import java.util.ArrayList;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Map;
import java.util.Optional;

/**
 * The TL1 agents of a network: every device of a group with a {@code tl1} section answers TL1 on
 * its own address, with its name as SID, from the group's data and users. Device i of a group is
 * agent {@code network.firstAgentId(group) + i}, the id it has for all its protocols. The
 * engine forgets an agent it stops; a device starts again by registering its agent anew.
 *
 * <p>Starts and stops are not safe to run concurrently with each other: the keep-alive a listener
 * takes is the one set last, so the launcher starts the groups one after another and the device
 * table serialises the control interface's starts and stops.
 */
public final class Tl1Network implements ProtocolAgents {
  /** The engine keeps at most this many characters of the text shared by one start call. */
  private static final int NETWORK_TEXT_LENGTH = 49;
  private static final int STARTED = 1;

  private final Network network;
  private final Map<String, Group> groupByName = new LinkedHashMap<>();
  private final TL1Handler handler;
  private final TL1Register register;

  /** The TL1 groups of the network, served by handler through register's engine calls. */
  public Tl1Network(Network network, TL1Handler handler, TL1Register register) {
    this.network = network;
    this.handler = handler;
    this.register = register;
    network.groups().stream().filter(group -> group.tl1().isPresent())
        .forEach(group -> groupByName.put(group.name(), group));
  }

  public boolean isEmpty() {
    return groupByName.isEmpty();
  }

  /**
   * Tells the handler every device it answers for, hands it to the engine and registers every
   * command code the devices answer; call once, after the engine is initialised.
   */
  public void register() {
    for (Group group : groupByName.values()) {
      Tl1 tl1 = group.tl1().orElseThrow();
      int firstId = network.firstAgentId(group);
      for (int i = 0; i < group.count(); i++) {
        handler.addDevice(firstId + i, group.deviceName(i), group.name(), tl1.data(), tl1.users());
      }
    }
    handler.nativeCacheThisObject(handler);
    for (String code : handler.commandCodes()) {
      register.registerTL1Commands(code); // false only for a code known already
    }
  }

  /**
   * Registers and opens devices [first, first + count) of a TL1 group; per device, empty when it
   * serves, else why it could not open.
   */
  public List<Optional<String>> startAgents(Group group, int first, int count) {
    Tl1 tl1 = group.tl1().orElseThrow();
    int firstId = network.firstAgentId(group);
    int[] agentIds = new int[count];
    String[] agentTexts = new String[count];
    String[] addresses = new String[count];
    String[] sids = new String[count];
    int[] ports = new int[count];
    for (int i = 0; i < count; i++) {
      agentIds[i] = firstId + first + i;
      agentTexts[i] = "device" + agentIds[i];
      addresses[i] = group.address(first + i);
      sids[i] = group.deviceName(first + i);
      ports[i] = tl1.port();
    }
    // A listener takes the keep-alive current when it opens: the group's own.
    register.KeepAliveTimeForTL1Agent(tl1.keepAlive());
    String networkText = group.name().substring(0, Math.min(NETWORK_TEXT_LENGTH, group.name().length()));
    int[] started = register.startTL1Network(agentIds, agentTexts, addresses, ports, networkText, sids, agentIds);
    List<Optional<String>> outcomes = new ArrayList<>(count);
    for (int i = 0; i < count; i++) {
      boolean opened = started != null && i < started.length && started[i] == STARTED;
      outcomes.add(opened ? afterOpen(tl1, agentIds[i], addresses[i])
          : Optional.of(cannotOpen(tl1.port(), addresses[i])));
    }
    return outcomes;
  }

  /** Login and the Telnet listener of an agent whose raw listener opened. */
  private Optional<String> afterOpen(Tl1 tl1, int agentId, String address) {
    if (tl1.requireLogin()) {
      register.setLoginRequired(agentId, true);
    }
    if (tl1.telnetPort().isPresent() && !register.startTelnetListener(address, tl1.telnetPort().getAsInt(), agentId)) {
      // Half a device is not served: its raw listener closes too, and it is failed as a whole.
      register.stopAgent(address, tl1.port());
      return Optional.of(cannotOpen(tl1.telnetPort().getAsInt(), address));
    }
    return Optional.empty();
  }

  private static String cannotOpen(int port, String address) {
    return "the TL1 agent cannot open TCP port " + port + " on " + address + " (is another program using it?)";
  }

  @Override
  public Optional<String> start(Device device) {
    Group group = groupByName.get(device.group());
    return startAgents(group, device.agentId() - network.firstAgentId(group), 1).get(0);
  }

  @Override
  public void stop(Device device) {
    register.stopAgent(device.address(), groupByName.get(device.group()).tl1().orElseThrow().port());
  }
}
