package com.kestrelon.simulator.tessel.snmp;

import com.kestrelon.simulator.tessel.NativeLibrary;
import java.util.Hashtable;
import java.util.function.IntFunction;

/**
 * The SNMP side of the engine: agent registration and lifecycle, and the value methods the engine
 * calls, concurrently from its request threads, for every Get, GetNext and Set. Values come from
 * the {@link DeviceStore} of the agent's device: the recorded data its devices share plus each
 * agent's own Sets.
 *
 * <p>What the engine can rely on:
 * <ul>
 *   <li>An answer is {value, error}, with error "-1" when there is none; a table GetNext answers
 *       {value, "column.instance" relative to the entry OID, error}. A null answer means no such
 *       instance.</li>
 *   <li>Values are engine texts: every octet-typed value (OCTET STRING, BIT STRING, Opaque,
 *       NsapAddress) as {@code 'hex'h}, OID values with a leading dot, IpAddress dotted, numbers
 *       decimal.</li>
 *   <li>{@link #ScalarGetNextOidVal} answers the object its sub-identifier names: the engine has
 *       already chosen the next object.</li>
 *   <li>{@link #TableGetNextOidVal} answers the next instance of the same column in OID order
 *       (numerically, sub-identifier by sub-identifier), or null when the column is exhausted.</li>
 *   <li>A Set changes the one agent it is for, keyed by agent id (the port the engine passes with
 *       a Set is the stored one, not the configured one). Set texts of the form {@code '...'h} are
 *       read as hex octets. An object the data does not have answers error "17" (notWritable); a
 *       text that is not a value of the object's type answers "10" (wrongValue). A successful Set
 *       answers the canonical text stored.</li>
 * </ul>
 * The engine reads texts from the host as UTF-8 ({@code NetworkSimulator.getBytes}).
 */
public class SnmpHandler {
  static {
    NativeLibrary.load();
  }

  private static final String NO_ERROR = "-1";
  private static final String WRONG_VALUE = "10";
  private static final String NOT_WRITABLE = "17";

  private final IntFunction<DeviceStore> stores;
  private volatile String status = "";
  private volatile int progress;

  /** A handler without objects: every Get finds nothing and every Set is refused. */
  public SnmpHandler() {
    this(DeviceStore.empty());
  }

  /** A handler whose every agent serves the values of {@code store}. */
  public SnmpHandler(DeviceStore store) {
    this(agentId -> store);
  }

  /** A handler whose agent {@code id} serves the values of {@code stores.apply(id)}. */
  public SnmpHandler(IntFunction<DeviceStore> stores) {
    this.stores = stores;
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

  /** A trap the host fires from its timers, as {@link SnmpTrapService#SendV1Trap}. */
  public native void SendV1TimerTrap(String managerHost, int managerPort, String community,
      String enterprise, int genericTrap, int specificTrap, String[] oids, int[] types,
      String[] values, int agentId, String agentText);

  /** A notification the host fires from its timers, as {@link SnmpTrapService#SendV2Trap}. */
  public native void SendV2TimerTrap(String managerHost, int managerPort, String community,
      String trapOid, String[] oids, int[] types, String[] values, int agentId, String agentText,
      int selector);

  /** What the engine tells of the informs its devices send, from its own threads. */
  public interface InformListener {
    /**
     * A Response from the manager acknowledged inform informId of the device at deviceAddress;
     * the bindings are the Response's, as OIDs, type names and value texts.
     */
    void answered(int informId, int requestId, String deviceAddress, String managerAddress,
        int managerPort, int errorStatus, int errorIndex, String[] oids, String[] types,
        String[] values);

    /** No Response came before the last timeout: the inform's own bindings. */
    void dropped(int informId, int version, String community, String userName,
        String contextName, String managerAddress, int managerPort, String[] oids,
        String[] types, String[] values);
  }

  private volatile InformListener informListener;

  public void setInformListener(InformListener listener) {
    informListener = listener;
  }

  /** Called by the engine for an acknowledged inform. */
  public void LogResponseMessage(int requestId, String managerAddress, int informId,
      String deviceAddress, int managerPort, int errorStatus, int errorIndex, String[] oids,
      String[] types, String[] values) {
    InformListener listener = informListener;
    if (listener != null) {
      listener.answered(informId, requestId, deviceAddress, managerAddress, managerPort,
          errorStatus, errorIndex, oids, types, values);
    }
  }

  /** Called by the engine for a dropped inform. */
  public void StoreDroppedInformMessage(int version, int informId, String community,
      String userName, String contextName, String managerAddress, int managerPort, String[] oids,
      String[] types, String[] values) {
    InformListener listener = informListener;
    if (listener != null) {
      listener.dropped(informId, version, community, userName, contextName, managerAddress,
          managerPort, oids, types, values);
    }
  }

  /** Decides which header fields of the PDUs passing through an agent are replaced. */
  public interface Scrambler {
    /**
     * The fields to replace in a PDU of the agent at agentAddress (keys errstat, errindex, reqid,
     * timeout and retries as Integer, command as Byte, community and oid as String), or null to
     * leave it alone. isResponse: the reply on its way out, else the PDU as received.
     */
    Hashtable<String, Object> scramble(String agentAddress, boolean isResponse);
  }

  private volatile Scrambler scrambler;

  /** The engine asks scrambler only while scrambling is switched on (NetworkSimulator.scramblePdu). */
  public void setScrambler(Scrambler scrambler) {
    this.scrambler = scrambler;
  }

  /**
   * Called by the engine, while scrambling is on, for every PDU an agent receives and every reply
   * it sends: the PDU's header, its bindings as texts, and the agent and manager it is between.
   */
  public Hashtable<String, Object> ScramblePDU(long version, String community, String[] oids,
      String[] values, long requestId, byte command, long errorStatus, long errorIndex,
      String enterprise, int timeout, int retries, String agentAddress, int agentPort,
      String managerAddress, boolean isResponse) {
    Scrambler current = scrambler;
    return current == null ? null : current.scramble(agentAddress, isResponse);
  }

  private static String[] answer(String value) {
    return value == null ? null : new String[] {value, NO_ERROR};
  }

  private String[] store(int agentId, String oidText, String value) {
    try {
      String stored = stores.apply(agentId).set(agentId, oidText, value);
      return stored == null ? new String[] {value, NOT_WRITABLE} : new String[] {stored, NO_ERROR};
    } catch (IllegalArgumentException e) {
      return new String[] {value, WRONG_VALUE};
    }
  }

  public String[] ScalarGetOidVal(String label, String groupOid, String subId, String instance,
      String databaseName, String tableName, int dataType, int agentId, int rowStatusColumn,
      String address, int port, String syntax) {
    return answer(stores.apply(agentId).get(agentId, groupOid + "." + subId + instance));
  }

  public String[] ScalarGetNextOidVal(String label, String groupOid, String subId, String instance,
      String previousSubId, String databaseName, String tableName, int dataType, int agentId,
      int rowStatusColumn, String address, int port, String syntax) {
    return answer(stores.apply(agentId).get(agentId, groupOid + "." + subId + instance));
  }

  public String[] SetOidVal(String label, String groupOid, String subId, String instance,
      String databaseName, String tableName, String value, int dataType, int agentId,
      int rowStatusColumn, String address, int port, String syntax) {
    return store(agentId, groupOid + "." + subId + instance, value);
  }

  public String[] TableGetOidVal(String label, String entryOid, String column, String instance,
      String databaseName, String tableName, int dataType, int agentId, int rowStatusColumn,
      String address, int port, String syntax) {
    return instance == null ? null : answer(stores.apply(agentId).get(agentId, entryOid + "." + column + instance));
  }

  public String[] TableGetNextOidVal(String label, String entryOid, String instance, int column,
      int nextColumn, int dataType, int nextDataType, String databaseName, String tableName,
      int agentId, int rowStatusColumn, String address, int port, String syntax) {
    String[] next = stores.apply(agentId).nextInColumn(agentId, entryOid, column, instance);
    return next == null ? null : new String[] {next[0], next[1], NO_ERROR};
  }

  public String[] TableSetOidVal(String label, String entryOid, String column, String instance,
      String databaseName, String tableName, String value, String[] rowColumns, String[] rowValues,
      String[] rowTypes, String[] extraColumns, String[] extraValues, String[] extraTypes,
      int dataType, int agentId, int rowStatusColumn, String address, int port, String syntax) {
    if (instance == null) {
      return new String[] {value, NOT_WRITABLE};
    }
    return store(agentId, entryOid + "." + column + instance, value);
  }

  public void setStatus(String text) {
    status = text;
  }

  public void setProgressValue(int value) {
    progress = value;
  }
}
