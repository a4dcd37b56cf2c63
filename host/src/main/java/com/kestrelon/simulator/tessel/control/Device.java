package com.kestrelon.simulator.tessel.control;

import java.util.Collections;
import java.util.LinkedHashMap;
import java.util.Map;

/**
 * A device as the control interface shows it: a snapshot, taken under the device table's lock.
 *
 * @param address the dotted IPv4 address
 * @param addressValue the same address as an unsigned 32-bit number
 * @param agentId the engine's id of the device's agents
 * @param protocols per protocol name (such as {@code snmp}), the state of the device's agent, in
 *     the order the network file names the protocols
 */
public record Device(String address, long addressValue, int agentId, String name, String group,
    Map<String, AgentState> protocols) {

  public Device {
    protocols = Collections.unmodifiableMap(new LinkedHashMap<>(protocols));
  }

  /** True when every protocol of the device serves. */
  public boolean running() {
    return protocols.values().stream().allMatch(state -> state == AgentState.RUNNING);
  }
}
