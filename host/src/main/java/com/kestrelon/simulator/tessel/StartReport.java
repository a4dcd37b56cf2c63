package com.kestrelon.simulator.tessel;

import com.kestrelon.simulator.tessel.control.AgentState;
import com.kestrelon.simulator.tessel.control.DeviceTable;
import java.io.PrintStream;
import java.util.ArrayList;
import java.util.EnumMap;
import java.util.List;
import java.util.Map;

/**
 * What the launcher says on the error stream while a network starts: a progress line that
 * rewrites itself (only for a person at a terminal: a log file would fill with them) and one
 * summary line once the network serves.
 */
final class StartReport {
  private static final long PROGRESS_INTERVAL_NANOS = 200_000_000L;

  private final PrintStream err;
  private final boolean progress;
  private final long total;
  private long shownAt = System.nanoTime();
  private boolean shown;

  StartReport(PrintStream err, boolean progress, long total) {
    this.err = err;
    this.progress = progress;
    this.total = total;
  }

  /** {@code done} devices of the total have been started (or have failed). */
  void progress(long done) {
    long now = System.nanoTime();
    if (progress && now - shownAt >= PROGRESS_INTERVAL_NANOS) {
      err.print("\rstarting devices " + done + "/" + total);
      err.flush();
      shownAt = now;
      shown = true;
    }
  }

  /** Clears the progress line, if one is shown. */
  void done() {
    if (shown) {
      err.print("\r\033[K");
      err.flush();
      shown = false;
    }
  }

  /** {@code 120 devices running: routers 100/100, optical 18/20 (2 failed)}. */
  static String summary(DeviceTable devices) {
    List<String> groups = new ArrayList<>();
    for (Map.Entry<String, Map<String, EnumMap<AgentState, Integer>>> group : devices.counts().entrySet()) {
      int count = 0;
      int failed = 0;
      int running = Integer.MAX_VALUE;
      for (EnumMap<AgentState, Integer> states : group.getValue().values()) {
        count = states.values().stream().mapToInt(Integer::intValue).sum();
        failed = Math.max(failed, states.get(AgentState.FAILED));
        running = Math.min(running, states.get(AgentState.RUNNING));
      }
      groups.add(group.getKey() + " " + running + "/" + count + (failed > 0 ? " (" + failed + " failed)" : ""));
    }
    return devices.running() + " devices running: " + String.join(", ", groups);
  }
}
