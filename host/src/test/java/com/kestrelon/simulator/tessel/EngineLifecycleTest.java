package com.kestrelon.simulator.tessel;

import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertNull;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrelon.simulator.nqx.ReportsUI;
import com.kestrelon.simulator.tessel.snmp.GetModeInfoImpl;
import com.kestrelon.simulator.tessel.snmp.SnmpHandler;
import com.kestrelon.simulator.tessel.snmp.SnmpRegister;
import java.util.List;
import org.junit.jupiter.api.AfterEach;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Test;

/** What the exports make of the host's Java arguments and give back to it, in a real JVM. */
class EngineLifecycleTest {
  private final NetworkSimulator simulator = new NetworkSimulator();
  private final SnmpHandler handler = new SnmpHandler();
  private final GetModeInfoImpl modeInfo = new GetModeInfoImpl();

  @BeforeEach
  void bindEngine() {
    assertTrue(simulator.nativeInitAgentParams(false, (byte) 0, "", 0, 1 << 20));
    assertTrue(handler.jniJVMparams());
    assertTrue(handler.initSnmpThread());
  }

  @AfterEach
  void stopEngine() {
    assertTrue(simulator.AdapterJniStopNetwork());
  }

  private static String[] strings(String... values) {
    return values;
  }

  @Test
  void agentTextsAndPortsCrossAsTheHostMeantThem() {
    assertEquals(7, handler.nativePassOneAgentInfo("données", "表", null, "127.0.0.5", (short) -1,
        strings("public"), strings("private"), null, 7, 0));
    assertEquals("données:表", modeInfo.GetModeInfo("127.0.0.5", "65535"), "UTF-8, unsigned port");
    assertNull(modeInfo.GetModeInfo("127.0.0.5", "161"));

    simulator.clearStatusLines();
    int[] sockets = handler.startSnmpNetwork(new int[] {1, 2}, strings("t1", "t2"),
        strings("300.0.2.1", "127.0.0.3"), new int[] {65536 + 162, 65536}, strings("p", "p"),
        strings("p", "p"), new int[] {0, 0}, "db", new int[] {0, 0});
    assertEquals(0, sockets[0], "an agent not opened is 0 to the host");
    assertTrue(sockets[1] > 2, "an opened agent is its socket");
    assertEquals(List.of(
        "Unable to start SNMP Agent at Port : 162 and at IpAddress : 300.0.2.1 ",
        "Snmp Agent Started at port : 0 and at IPAddress : 127.0.0.3"), simulator.statusLines());

    assertNull(handler.startSnmpNetwork(new int[] {1, 2}, strings("t1"), strings("127.0.0.1"),
        new int[] {161}, strings("p"), strings("p"), new int[] {0}, "db", new int[] {0}),
        "arrays shorter than the agent ids are refused");
    assertNull(handler.startSnmpNetwork(null, null, null, null, null, null, null, null, null));
  }

  @Test
  void cellColumnsAreTakenUpToTheirCount() {
    SnmpRegister register = new SnmpRegister();
    int before = handler.jnistoreTreeCellReferences();
    assertTrue(register.JniCreateTreeCell("system", null, "V2", ".1.3.6.1.2.1.1.1", 2,
        strings("1", "2", "3"), strings("4", "6", "67"), strings("43690", "43690", "43690"), false,
        0, null));
    assertTrue(register.JniCreateTreeCell("ifEntry", null, "V2", ".1.3.6.1.2.1.2.2.1", 1,
        strings("1"), strings("2"), strings("43690"), true, 0, strings("InterfaceIndex")));
    assertFalse(register.JniCreateTreeCell("short", null, "V2", ".1.3.6.1.4.1.1", 3,
        strings("1"), strings("2"), strings("43690"), false, 0, null));
    assertTrue(register.JniCreateTreeCell("last", null, "V2", ".1.3.6.1.9.9.9.1", 1,
        strings("1"), strings("2"), strings("43690"), false, 0, null));
    assertEquals(before + 3, handler.jnistoreTreeCellReferences());
    assertEquals(".1.3.6.1.2.1.2.2.1", handler.GetNextGroupOid(".1.3.6.1.2.1.1.1.0"));
    assertNull(handler.GetNextGroupOid(".1.3.6.1.9.9.9.1.0"), "the last cell has no next");
  }

  @Test
  void reportArraysHaveTheirSizes() {
    ReportsUI reports = new ReportsUI();
    assertEquals(28, reports.getReportOverviewDetails().length);
    assertArrayEquals(new int[] {0}, reports.getErrorLogs());
    assertArrayEquals(new String[2], reports.getIpAddrArr(2));
  }
}
