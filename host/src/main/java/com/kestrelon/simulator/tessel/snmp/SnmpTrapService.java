package com.kestrelon.simulator.tessel.snmp;

import com.kestrelon.simulator.tessel.NativeLibrary;

/**
 * Traps that a device sends to one manager, from its own address and SNMP port. The device is
 * named by its agent id ({@link GetModeInfoImpl#GetAgentID}); agentText only names it in the
 * engine's log. The extra bindings are three arrays of one length: OIDs, BER type codes (153 for
 * OCTET STRING) and value texts as the device data keeps them; null arrays add no bindings, and
 * arrays of different lengths send nothing. Each manager receives the trap in its own version.
 */
public class SnmpTrapService {
  static {
    NativeLibrary.load();
  }

  /** An SNMPv1 Trap; a binding of sysUpTime.0 also gives its time-stamp. */
  public native void SendV1Trap(String managerHost, int managerPort, String community,
      String enterprise, int genericTrap, int specificTrap, String[] oids, int[] types,
      String[] values, int agentId, String agentText);

  /** An SNMPv2c notification: an SNMPv2-Trap when selector is 1, else an InformRequest. */
  public native void SendV2Trap(String managerHost, int managerPort, String community,
      String trapOid, String[] oids, int[] types, String[] values, int agentId, String agentText,
      int selector);
}
