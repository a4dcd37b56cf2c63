package com.kestrelon.simulator.tessel.snmp;

import com.kestrelon.simulator.tessel.NativeLibrary;

/**
 * The SNMP side of the engine: agent registration and lifecycle, and the value methods the engine
 * calls (concurrently, from its request threads) for every Get, GetNext and Set. Values are kept
 * in a {@link ValueStore}; an answer is {value, error} ("-1" no error), null when there is none.
 */
public class SnmpHandler {
  static {
    NativeLibrary.load();
  }

  private static final String NO_ERROR = "-1";

  private final ValueStore values = new ValueStore();
  private volatile String status = "";
  private volatile int progress;

  public ValueStore values() {
    return values;
  }

  public String status() {
    return status;
  }

  public int progress() {
    return progress;
  }

  public native boolean jniJVMparams();

  public native int[] startSnmpNetwork(
      int[] agentIds,
      String[] tableNames,
      String[] addresses,
      int[] ports,
      String[] readCommunities,
      String[] writeCommunities,
      int[] engineBoots,
      String databaseName,
      int[] ipv6Flags);

  public native int nativePassOneAgentInfo(
      String databaseName,
      String tableName,
      String ignored1,
      String address,
      short port,
      String[] readCommunities,
      String[] writeCommunities,
      String ignored2,
      int agentId,
      int ipv6Flag);

  public native boolean startAgent(String address, int port, int engineBoots);

  public native boolean stopAgent(String address, int port);

  public native boolean restartAgent(int index);

  public native boolean initSnmpThread();

  public native int jnistoreTreeCellReferences();

  public native void setCommunitiesValue(String address, String[] read, String[] write, int mode);

  public native void SetTrapPort(int port);

  public native void setEngineBootCount(int count);

  public native String GetNextGroupOid(String oid);

  private static String[] answer(String value) {
    return value == null ? null : new String[] {value, NO_ERROR};
  }

  private String[] store(String oid, String value) {
    values.put(oid, value);
    return new String[] {value, NO_ERROR};
  }

  public String[] ScalarGetOidVal(String label, String groupOid, String subId, String instance,
      String databaseName, String tableName, int dataType, int agentId, int rowStatusColumn,
      String address, int port, String syntax) {
    return answer(values.get(groupOid + "." + subId + instance));
  }

  public String[] ScalarGetNextOidVal(String label, String groupOid, String subId, String instance,
      String previousSubId, String databaseName, String tableName, int dataType, int agentId,
      int rowStatusColumn, String address, int port, String syntax) {
    return answer(values.get(groupOid + "." + subId + instance));
  }

  public String[] SetOidVal(String label, String groupOid, String subId, String instance,
      String databaseName, String tableName, String value, int dataType, int agentId,
      int rowStatusColumn, String address, int port, String syntax) {
    return store(groupOid + "." + subId + instance, value);
  }

  public String[] TableGetOidVal(String label, String entryOid, String column, String instance,
      String databaseName, String tableName, int dataType, int agentId, int rowStatusColumn,
      String address, int port, String syntax) {
    return answer(values.get(entryOid + "." + column + instance));
  }

  public String[] TableGetNextOidVal(String label, String entryOid, String instance, int column,
      int nextColumn, int dataType, int nextDataType, String databaseName, String tableName,
      int agentId, int rowStatusColumn, String address, int port, String syntax) {
    String[] next = values.nextInColumn(entryOid, column, instance);
    return next == null ? null : new String[] {next[0], next[1], NO_ERROR};
  }

  public String[] TableSetOidVal(String label, String entryOid, String column, String instance,
      String databaseName, String tableName, String value, String[] rowColumns, String[] rowValues,
      String[] rowTypes, String[] extraColumns, String[] extraValues, String[] extraTypes,
      int dataType, int agentId, int rowStatusColumn, String address, int port, String syntax) {
    return store(entryOid + "." + column + instance, value);
  }

  public void setStatus(String text) {
    status = text;
  }

  public void setProgressValue(int value) {
    progress = value;
  }
}
