package com.kestrelon.simulator.tessel;

import com.kestrelon.simulator.tessel.snmp.SnmpHandler;

/** What the native host-bridge test asks the JVM about. */
public final class NativeProbe {
  private NativeProbe() {}

  /** Live threads with this name. */
  public static int threadsNamed(String name) {
    int count = 0;
    for (Thread thread : Thread.getAllStackTraces().keySet()) {
      if (thread.getName().equals(name)) {
        count++;
      }
    }
    return count;
  }

  public static String lastStatus(NetworkSimulator simulator) {
    var lines = simulator.statusLines();
    return lines.isEmpty() ? null : lines.get(lines.size() - 1);
  }

  /** A handler whose scalar Get always throws. */
  public static final class ThrowingHandler extends SnmpHandler {
    @Override
    public String[] ScalarGetOidVal(String label, String groupOid, String subId, String instance,
        String databaseName, String tableName, int dataType, int agentId, int rowStatusColumn,
        String address, int port, String syntax) {
      throw new IllegalStateException("host failure");
    }
  }
}
