package com.kestrelon.simulator.tessel.snmp;

import com.kestrelon.simulator.tessel.NetworkSimulator;
import java.util.ArrayList;
import java.util.List;
import java.util.concurrent.ArrayBlockingQueue;
import java.util.concurrent.BlockingQueue;
import java.util.concurrent.TimeUnit;

/**
 * Starts one device and has it send one notification through the engine's exports, for tests
 * that watch a real manager receive it:
 *
 * <pre>NotifyProbe DEVICE PORT MANAGER_HOST MANAGER_PORT KIND COMMUNITY TRAP [OID TYPE VALUE]...</pre>
 *
 * KIND is v1trap (TRAP is ENTERPRISE/GENERIC/SPECIFIC), v2trap, v2inform, v3trap or v3inform (TRAP is the
 * snmpTrapOID; for v3 COMMUNITY is USER/CONTEXT, users from the SNMPv3 configuration named by
 * the system property tessel.snmpv3); TYPE is the BER type code. Prints "probe: sent" once the notification is on its way,
 * and for an inform then "probe: answered DEVICE MANAGER:PORT" or "probe: dropped MANAGER:PORT" as the engine reports it (within 15
 * seconds). The system properties tessel.log.level and tessel.log.file turn the engine's log on.
 */
public final class NotifyProbe {
  private NotifyProbe() {}

  public static void main(String[] args) throws Exception {
    String device = args[0];
    int port = Integer.parseInt(args[1]);
    String managerHost = args[2];
    int managerPort = Integer.parseInt(args[3]);
    String kind = args[4];
    String community = args[5];
    String trap = args[6];
    List<String> oids = new ArrayList<>();
    List<String> values = new ArrayList<>();
    int[] types = new int[(args.length - 7) / 3];
    for (int i = 7; i + 2 < args.length; i += 3) {
      oids.add(args[i]);
      types[(i - 7) / 3] = Integer.parseInt(args[i + 1]);
      values.add(args[i + 2]);
    }
    NetworkSimulator simulator = new NetworkSimulator();
    SnmpHandler handler = new SnmpHandler();
    BlockingQueue<String> informs = new ArrayBlockingQueue<>(4);
    handler.setInformListener(new SnmpHandler.InformListener() {
      @Override
      public void answered(int informId, int requestId, String deviceAddress,
          String managerAddress, int managerPort, int errorStatus, int errorIndex, String[] oids,
          String[] types, String[] values) {
        informs.add("answered " + deviceAddress + " " + managerAddress + ":" + managerPort);
      }

      @Override
      public void dropped(int informId, int version, String community, String userName,
          String contextName, String managerAddress, int managerPort, String[] oids,
          String[] types, String[] values) {
        informs.add("dropped " + managerAddress + ":" + managerPort);
      }
    });
    if (!simulator.nativeInitAgentParams(true,
        (byte) Integer.getInteger("tessel.log.level", 0).intValue(),
        System.getProperty("tessel.log.file", "tessel-probe.log"), 0, 1 << 24)
        || !handler.jniJVMparams()) {
      throw new IllegalStateException("the engine did not start");
    }
    String snmpV3 = System.getProperty("tessel.snmpv3");
    if (snmpV3 != null) {
      SnmpV3Config.load(java.nio.file.Path.of(snmpV3)).apply(new SerToCConverter());
    }
    int[] sockets = handler.startSnmpNetwork(new int[] {1}, new String[] {"t"},
        new String[] {device}, new int[] {port}, new String[] {"public"},
        new String[] {"private"}, new int[] {0}, "db", new int[] {0});
    if (sockets[0] <= 0 || !handler.initSnmpThread()) {
      throw new IllegalStateException("the device did not start");
    }
    String[] oidArray = oids.toArray(new String[0]);
    String[] valueArray = values.toArray(new String[0]);
    switch (kind) {
      case "v1trap" -> {
        String[] parts = trap.split("/");
        new SnmpTrapService().SendV1Trap(managerHost, managerPort, community, parts[0],
            Integer.parseInt(parts[1]), Integer.parseInt(parts[2]), oidArray, types, valueArray,
            1, device);
      }
      case "v2trap" -> new SnmpTrapService().SendV2Trap(managerHost, managerPort, community, trap,
          oidArray, types, valueArray, 1, device, 1);
      case "v2inform" -> new SnmpInformInterfaceImpl().SendV2Inform(managerHost, managerPort,
          community, trap, oidArray, types, valueArray, 1, device, 2);
      case "v3trap" -> {
        String[] principal = (community + "/").split("/", -1);
        new SnmpTrapService().SendV3Trap(managerHost, managerPort, "", trap, principal[0],
            principal[1], oidArray, types, valueArray, 1, device);
      }
      case "v3inform" -> {
        String[] principal = (community + "/").split("/", -1);
        new SnmpInformInterfaceImpl().SendV3Inform(managerHost, managerPort, "", trap,
            principal[0], principal[1], oidArray, types, valueArray, 1, device);
      }
      default -> throw new IllegalArgumentException("unknown kind " + kind);
    }
    System.out.println("probe: sent");
    if (kind.endsWith("inform")) {
      String outcome = informs.poll(15, TimeUnit.SECONDS);
      System.out.println("probe: " + (outcome == null ? "nothing reported" : outcome));
    }
    System.out.flush();
    simulator.AdapterJniStopNetwork();
  }
}
