package com.kestrelon.simulator.tessel.control;

import com.kestrelon.simulator.tessel.snmp.SnmpTrapService;

/** Notifications sent by the running engine from a device's own address and SNMP port. */
public final class NativeNotifications implements NotificationSender {
  private static final int TRAP_V1 = 0xA4;
  private static final int INFORM = 0xA6;
  private static final int TRAP_V2 = 0xA7;

  private final SnmpTrapService engine = new SnmpTrapService();

  @Override
  public Outcome send(Device device, Notification n) {
    // The form follows what the notification names (an enterprise makes an SNMPv1 trap); the engine
    // puts it in the manager's version.
    int pduType = n.inform() ? INFORM : n.enterprise().isEmpty() ? TRAP_V2 : TRAP_V1;
    int[] outcome = engine.sendNotification(pduType, n.version().number(), n.managerHost(),
        n.managerPort(), n.community(), n.user(), n.context(), n.enterprise(), n.generic(),
        n.specific(), n.oid(), n.bindingOids(), n.bindingTypes(), n.bindingValues(),
        device.agentId(), device.address(), n.timeout(), n.retries());
    Result result = outcome == null || outcome.length != 2 ? null : Result.ofCode(outcome[0]);
    if (result == null) {
      throw new IllegalStateException("the engine could not read the notification");
    }
    return new Outcome(result, outcome[1]);
  }
}
