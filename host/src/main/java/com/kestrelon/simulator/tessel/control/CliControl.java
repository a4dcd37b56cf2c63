package com.kestrelon.simulator.tessel.control;

import java.util.Optional;

/** What the CLI agents of a running network give the control interface. */
public interface CliControl {
  /** A network without CLI agents: no configuration, nothing counted. */
  CliControl NONE = new CliControl() {
    @Override
    public Optional<String> runningConfig(Device device) {
      return Optional.empty();
    }

    @Override
    public Counters counters() {
      return new Counters(0, 0, 0);
    }
  };

  /** The device's running configuration as its show running-config lists it; empty when it has none. */
  Optional<String> runningConfig(Device device);

  /** CLI sessions open now, and logins and commands since the start, over every device. */
  Counters counters();

  record Counters(long sessions, long logins, long commands) {}
}
