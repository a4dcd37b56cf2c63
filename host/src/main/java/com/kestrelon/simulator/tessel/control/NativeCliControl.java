package com.kestrelon.simulator.tessel.control;

import com.kestrelon.simulator.tessel.cli.CliHandler;
import java.util.Optional;

/** The control interface's CLI views: configurations from the host, counters from the engine. */
public final class NativeCliControl implements CliControl {
  private final CliHandler handler;

  public NativeCliControl(CliHandler handler) {
    this.handler = handler;
  }

  @Override
  public Optional<String> runningConfig(Device device) {
    return handler.runningConfig(device.address());
  }

  @Override
  public Counters counters() {
    long[] counters = handler.cliCounters();
    return counters == null || counters.length < 3 ? new Counters(0, 0, 0)
        : new Counters(counters[0], counters[1], counters[2]);
  }
}
