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
}
