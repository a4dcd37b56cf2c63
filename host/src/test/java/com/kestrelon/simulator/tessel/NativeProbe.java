package com.kestrelon.simulator.tessel;

import com.kestrelon.simulator.tessel.data.DeviceData;
import com.kestrelon.simulator.tessel.data.DeviceDataException;
import com.kestrelon.simulator.tessel.snmp.DeviceStore;
import com.kestrelon.simulator.tessel.snmp.SnmpHandler;

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
}
