package com.kestrelon.simulator.tessel;

import com.kestrelon.simulator.tessel.data.DeviceData;
import com.kestrelon.simulator.tessel.data.DeviceDataException;
import com.kestrelon.simulator.tessel.snmp.DeviceStore;
import com.kestrelon.simulator.tessel.snmp.SnmpHandler;
import java.util.Arrays;
import java.util.Hashtable;

/** What the native host-bridge test asks the JVM about, and the handlers it binds. */
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

  /** The host's own handler over a few system objects and two ifDescr instances. */
  public static SnmpHandler handler() throws DeviceDataException {
    return new SnmpHandler(probeStore());
  }

  private static DeviceStore probeStore() throws DeviceDataException {
    return new DeviceStore(DeviceData.parse("probe.snmprec", String.join("\n",
        "1.3.6.1.2.1.1.1.0|4|descr", "1.3.6.1.2.1.1.4.0|4|contact", "1.3.6.1.2.1.1.5.0|4|name",
        "1.3.6.1.2.1.2.2.1.2.1|4|old0", "1.3.6.1.2.1.2.2.1.2.3|4|old2")));
  }

  /** A handler whose scalar Get always throws. */
  public static final class ThrowingHandler extends SnmpHandler {
    public ThrowingHandler() throws DeviceDataException {
      super(probeStore());
    }

    @Override
    public String[] ScalarGetOidVal(String label, String groupOid, String subId, String instance,
        String databaseName, String tableName, int dataType, int agentId, int rowStatusColumn,
        String address, int port, String syntax) {
      throw new IllegalStateException("host failure");
    }
  }

  /**
   * A handler whose scrambler answers every argument it was given, in order, as the community,
   * with a field of each type; for the agent "wrong-type" a reqid that is not a number.
   */
  public static final class ScramblingHandler extends SnmpHandler {
    @Override
    public Hashtable<String, Object> ScramblePDU(long version, String community, String[] oids,
        String[] values, long requestId, byte command, long errorStatus, long errorIndex,
        String enterprise, int timeout, int retries, String agentAddress, int agentPort,
        String managerAddress, boolean isResponse) {
      Hashtable<String, Object> fields = new Hashtable<>();
      if (agentAddress.equals("wrong-type")) {
        fields.put("reqid", "5");
        return fields;
      }
      fields.put("community", String.join(" ", String.valueOf(version), community, Arrays.toString(oids),
          Arrays.toString(values), String.valueOf(requestId), String.valueOf(command), String.valueOf(errorStatus),
          String.valueOf(errorIndex), enterprise, String.valueOf(timeout), String.valueOf(retries), agentAddress,
          String.valueOf(agentPort), managerAddress, String.valueOf(isResponse)));
      fields.put("reqid", 5);
      fields.put("command", (byte) 0xA2);
      fields.put("oid", ".1.3.6.1.4.1.99");
      fields.put("retries", 2);
      fields.put("unknown", new Object());
      return fields;
    }
  }
}
