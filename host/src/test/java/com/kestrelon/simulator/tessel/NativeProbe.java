package com.kestrelon.simulator.tessel;

import com.kestrelon.simulator.tessel.snmp.SnmpHandler;
import com.kestrelon.simulator.tessel.snmp.ValueStore;

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

  /**
   * A handler that stores any Set text as given and answers it back, for any OID: the bridge is
   * tested for what crosses it, not for the device data.
   */
  public static class MemoryHandler extends SnmpHandler {
    private static final String NO_ERROR = "-1";
    private final ValueStore values = new ValueStore();

    private static String[] answer(String value) {
      return value == null ? null : new String[] {value, NO_ERROR};
    }

    private String[] store(String oid, String value) {
      values.put(oid, value);
      return new String[] {value, NO_ERROR};
    }

    @Override
    public String[] ScalarGetOidVal(String label, String groupOid, String subId, String instance,
        String databaseName, String tableName, int dataType, int agentId, int rowStatusColumn,
        String address, int port, String syntax) {
      return answer(values.get(groupOid + "." + subId + instance));
    }

    @Override
    public String[] ScalarGetNextOidVal(String label, String groupOid, String subId, String instance,
        String previousSubId, String databaseName, String tableName, int dataType, int agentId,
        int rowStatusColumn, String address, int port, String syntax) {
      return answer(values.get(groupOid + "." + subId + instance));
    }

    @Override
    public String[] SetOidVal(String label, String groupOid, String subId, String instance,
        String databaseName, String tableName, String value, int dataType, int agentId,
        int rowStatusColumn, String address, int port, String syntax) {
      return store(groupOid + "." + subId + instance, value);
    }

    @Override
    public String[] TableGetOidVal(String label, String entryOid, String column, String instance,
        String databaseName, String tableName, int dataType, int agentId, int rowStatusColumn,
        String address, int port, String syntax) {
      return answer(values.get(entryOid + "." + column + instance));
    }

    @Override
    public String[] TableGetNextOidVal(String label, String entryOid, String instance, int column,
        int nextColumn, int dataType, int nextDataType, String databaseName, String tableName,
        int agentId, int rowStatusColumn, String address, int port, String syntax) {
      String[] next = values.nextInColumn(entryOid, column, instance);
      return next == null ? null : new String[] {next[0], next[1], NO_ERROR};
    }

    @Override
    public String[] TableSetOidVal(String label, String entryOid, String column, String instance,
        String databaseName, String tableName, String value, String[] rowColumns,
        String[] rowValues, String[] rowTypes, String[] extraColumns, String[] extraValues,
        String[] extraTypes, int dataType, int agentId, int rowStatusColumn, String address,
        int port, String syntax) {
      return store(entryOid + "." + column + instance, value);
    }
  }

  /** A handler whose scalar Get always throws. */
  public static final class ThrowingHandler extends MemoryHandler {
    @Override
    public String[] ScalarGetOidVal(String label, String groupOid, String subId, String instance,
        String databaseName, String tableName, int dataType, int agentId, int rowStatusColumn,
        String address, int port, String syntax) {
      throw new IllegalStateException("host failure");
    }
  }
}
