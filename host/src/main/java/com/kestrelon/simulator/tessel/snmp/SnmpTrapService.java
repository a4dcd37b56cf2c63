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

  /**
   * An SNMPv2-Trap over SNMPv3 to userName, a user of the engine's SNMPv3 configuration, at the
   * user's level and in contextName; the device is the authoritative engine. Not sent when the
   * user or context is unknown, or when the user's notify view leaves out the trap or a binding.
   * The community is not used.
   */
  public native void SendV3Trap(String managerHost, int managerPort, String community,
      String trapOid, String userName, String contextName, String[] oids, int[] types,
      String[] values, int agentId, String agentText);

  /**
   * One notification with its outcome, for hosts that must know it: pduType is the PDU's tag
   * (0xA4 Trap, 0xA7 SNMPv2-Trap, 0xA6 InformRequest), version the manager's (0 SNMPv1, 1 SNMPv2c,
   * 3 SNMPv3); enterprise, genericTrap and specificTrap make the SNMPv1 form, trapOid the SNMPv2
   * one; an inform waits timeout seconds for its Response and is sent again retries times.
   * Returns {result, informId}: result 0 when sent, else the reason it was not (see
   * {@code NotificationSender.Result}); informId names the inform in the handler's reports (an
   * SNMPv3 inform's too, though it leaves only once its manager is discovered), 0 for a trap.
   */
  public native int[] sendNotification(int pduType, int version, String managerHost,
      int managerPort, String community, String userName, String contextName, String enterprise,
      int genericTrap, int specificTrap, String trapOid, String[] oids, int[] types,
      String[] values, int agentId, String agentText, int timeout, int retries);

  /**
   * The trap sinks of the devices with agent ids [firstAgentId, firstAgentId + count), replacing
   * those given before for the same first id; give them before the devices start, whose coldStart
   * goes to them. One element per sink in every array: version 0 (SNMPv1), 1 (SNMPv2c) or 3
   * (SNMPv3), host and port, community (SNMPv1, SNMPv2c), user and context (SNMPv3), inform 1 for
   * an inform sink, its timeout in seconds and retries. Returns -1 when set, the index of the first
   * sink whose host does not resolve, or -2 when the arrays differ in length.
   */
  public native int setTrapSinks(int firstAgentId, int count, int[] versions, String[] hosts,
      int[] ports, String[] communities, String[] users, String[] contexts, int[] informs,
      int[] timeouts, int[] retries);
}
