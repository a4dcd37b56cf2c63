package com.kestrelon.simulator.tessel.snmp;

import com.kestrelon.simulator.tessel.NativeLibrary;

/**
 * Informs that a device sends to one manager, from its own address and SNMP port, with the
 * arguments of {@link SnmpTrapService}. An inform waits 5 seconds for the manager's Response and
 * is not sent again; the engine then reports it to the handler's {@code StoreDroppedInformMessage},
 * and an answered one to its {@code LogResponseMessage}.
 */
public class SnmpInformInterfaceImpl {
  static {
    NativeLibrary.load();
  }

  /** An SNMPv2c InformRequest (an SNMPv2-Trap when selector is 1). */
  public native void SendV2Inform(String managerHost, int managerPort, String community,
      String trapOid, String[] oids, int[] types, String[] values, int agentId, String agentText,
      int selector);

  /**
   * An SNMPv3 InformRequest to userName, at the user's level and in contextName (see
   * {@link SnmpTrapService#SendV3Trap}). The device first discovers the manager's engine from an
   * ephemeral port of its address; a manager that does not answer within 0.6 s gets nothing and
   * the inform is reported dropped at once. The community is not used.
   */
  public native void SendV3Inform(String managerHost, int managerPort, String community,
      String trapOid, String userName, String contextName, String[] oids, int[] types,
      String[] values, int agentId, String agentText);
}
