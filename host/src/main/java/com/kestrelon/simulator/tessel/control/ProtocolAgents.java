package com.kestrelon.simulator.tessel.control;

import java.util.Optional;

/** One protocol's agents of a running network, opened and closed one device at a time. */
public interface ProtocolAgents {
  /** Opens the device's agent; empty when it serves again, else why it could not open. */
  Optional<String> start(Device device);

  /** Closes the device's agent and its sockets; a closed agent stays closed. */
  void stop(Device device);
}
