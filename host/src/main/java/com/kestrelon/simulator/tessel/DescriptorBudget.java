package com.kestrelon.simulator.tessel;

import java.io.IOException;
import java.io.UncheckedIOException;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.Optional;
import java.util.stream.Stream;

/**
 * How many agents the process's open-file limit leaves room for. Every started agent holds one
 * socket; besides those the process keeps the descriptors it has open when the agents start, and
 * needs a few more afterwards: the engine's epoll instances, its stop event, wildcard and
 * notification sockets, and files the JVM opens later.
 *
 * @param softLimit the open-file limit that applies, {@link #UNLIMITED} for none
 * @param hardLimit the most the process may raise it to without CAP_SYS_RESOURCE
 * @param open descriptors open now
 */
record DescriptorBudget(long softLimit, long hardLimit, long open) {
  static final long UNLIMITED = Long.MAX_VALUE;
  /** Descriptors kept for what the engine and the JVM open after the agents. */
  static final int RESERVE = 64;

  private static final String OPEN_FILES = "Max open files";

  /** The agents that fit; 0 when even the reserve does not. */
  int allowedAgents() {
    if (softLimit == UNLIMITED) {
      return Integer.MAX_VALUE;
    }
    return (int) Math.max(0, Math.min(Integer.MAX_VALUE, softLimit - open - RESERVE));
  }

  /** The one line that says why only {@link #allowedAgents} of {@code requested} start. */
  String shortfall(int requested) {
    return shortfall(requested, allowedAgents());
  }

  /**
   * The one line that says why only {@link #allowedAgents} of {@code requested} agents open, and
   * how many devices start with them (a device of several protocols holds several).
   */
  String shortfall(int requested, long devices) {
    return "tessel: the open-file limit allows " + allowedAgents() + " agents, not " + requested + ": it is "
        + softLimit + " (hard limit " + hardLimit + "), " + open + " descriptors are open and "
        + RESERVE + " are kept for the engine and the JVM; starting " + devices + " devices (more"
        + " need a higher `ulimit -Hn`, or root with CAP_SYS_RESOURCE)";
  }

  /** This process's budget, read from /proc after the engine has raised its limit. */
  static Optional<DescriptorBudget> ofThisProcess() {
    try (Stream<Path> descriptors = Files.list(Path.of("/proc/self/fd"))) {
      long open = descriptors.count();
      return parse(Files.readString(Path.of("/proc/self/limits")), open);
    } catch (IOException | UncheckedIOException e) {
      return Optional.empty();
    }
  }

  /** The budget for the "Max open files" line of a /proc/PID/limits text; empty without one. */
  static Optional<DescriptorBudget> parse(String limits, long open) {
    return limits.lines().filter(line -> line.startsWith(OPEN_FILES)).findFirst()
        .flatMap(line -> budget(line.substring(OPEN_FILES.length()).trim().split("\\s+"), open));
  }

  /** The budget of a "Max open files" line's values: soft limit, hard limit, units. */
  private static Optional<DescriptorBudget> budget(String[] values, long open) {
    if (values.length < 2) {
      return Optional.empty();
    }
    try {
      return Optional.of(new DescriptorBudget(limit(values[0]), limit(values[1]), open));
    } catch (NumberFormatException e) {
      return Optional.empty();
    }
  }

  private static long limit(String text) {
    return text.equals("unlimited") ? UNLIMITED : Long.parseLong(text);
  }
}
