package com.kestrelon.simulator.tessel.control;

import com.kestrelon.simulator.nqx.ReportsUI;
import java.util.ArrayList;
import java.util.List;

/** The running engine's reports, in the control interface's words. */
public final class NativeReports implements EngineReports {
  /** Integers per entry of the engine's error log: request-id, version, PDU type, error status. */
  private static final int ERROR_FIELDS = 4;

  private final ReportsUI engine = new ReportsUI();

  @Override
  public long[] counters() {
    int[] raw = engine.getReportOverviewDetails();
    long[] counters = new long[COUNTER_NAMES.size()];
    for (int i = 0; i < counters.length && i < raw.length; i++) {
      counters[i] = Integer.toUnsignedLong(raw[i]);
    }
    return counters;
  }

  /**
   * Synchronized: the engine keeps the managers' addresses of its last log read, so the two calls
   * must not interleave with another reader's.
   */
  @Override
  public synchronized List<RequestError> errors() {
    int[] log = engine.getErrorLogs();
    int count = log.length == 0 ? 0 : Math.min(log[log.length - 1], (log.length - 1) / ERROR_FIELDS);
    String[] managers = count == 0 ? new String[0] : engine.getIpAddrArr(count);
    List<RequestError> errors = new ArrayList<>(count);
    for (int i = 0; i < count; i++) {
      int at = i * ERROR_FIELDS;
      String manager = i < managers.length ? managers[i] : "";
      errors.add(new RequestError(manager, Integer.toUnsignedLong(log[at]), versionName(log[at + 1]),
          pduName(log[at + 2]), log[at + 3]));
    }
    return errors;
  }

  /** The engine numbers versions as the message's version field does: 0, 1 and 3. */
  static String versionName(int version) {
    return switch (version) {
      case 0 -> "v1";
      case 1 -> "v2c";
      case 3 -> "v3";
      default -> "version " + version;
    };
  }

  /** The engine logs the request's PDU tag octet. */
  static String pduName(int type) {
    return switch (type & 0xFF) {
      case 0xA0 -> "get";
      case 0xA1 -> "getNext";
      case 0xA3 -> "set";
      case 0xA5 -> "getBulk";
      case 0xA6 -> "inform";
      default -> String.format("0x%02x", type & 0xFF);
    };
  }
}
