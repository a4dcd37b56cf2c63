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
import java.nio.file.Files;
import java.nio.file.Path;
import org.junit.jupiter.api.AfterEach;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;

/** The engine driven through its exports in a real JVM, the way the host drives it. */
class EngineLifecycleTest {
  private static final String NOT_STARTED = "Unable to start SNMP Agent at Port : %d and at IpAddress : %s ";

  private final NetworkSimulator simulator = new NetworkSimulator();
  private final SnmpHandler handler = new SnmpHandler();
  private final GetModeInfoImpl modeInfo = new GetModeInfoImpl();

  @TempDir Path logDirectory;

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
  void aTracingEngineWritesItsLogFile() throws Exception {
    Path traced = logDirectory.resolve("traced.log");
    assertTrue(simulator.nativeInitAgentParams(false, (byte) 3, traced.toString(), 0, 1 << 20));
    assertTrue(handler.jniJVMparams());
    assertTrue(Files.size(traced) > 0, "a level-3 engine traces its calls");
  }

  @Test
  void registeredAgentsAreFoundByAddressAndStopRemovesThem() {
    String[] none = strings();
    assertEquals(7, handler.nativePassOneAgentInfo("données", "表", null, "127.0.0.5", (short) 161,
        strings("public"), strings("private"), null, 7, 0));
    assertEquals("données:表", modeInfo.GetModeInfo("127.0.0.5", "161"), "texts cross as UTF-8");
    assertNull(modeInfo.GetModeInfo("127.0.0.5", "162"));
    assertEquals(7, modeInfo.GetAgentID("127.0.0.5", "9"));
    assertEquals(-1, modeInfo.GetAgentID("127.0.0.6", "161"));

    // A short port is unsigned: (short) 65535 is port 65535.
    assertEquals(8, handler.nativePassOneAgentInfo("db", "t", null, "300.0.2.8", (short) -1, none, none,
        null, 8, 0));
    assertEquals("db:t", modeInfo.GetModeInfo("300.0.2.8", "65535"));

    // An address that is no IPv4 address cannot be bound: the start fails and the host is told.
    simulator.clearStatusLines();
    assertFalse(handler.startAgent("300.0.2.8", 65535, 1));
    assertTrue(simulator.statusLines().contains(String.format(NOT_STARTED, 65535, "300.0.2.8")));

    assertTrue(handler.stopAgent("127.0.0.5", 161));
    assertEquals(-1, modeInfo.GetAgentID("127.0.0.5", "161"));
    assertTrue(handler.restartAgent(0), "the stopped-but-registered agent keeps its place");
  }

  @Test
  void startSnmpNetworkReportsEveryAgentItCannotOpen() {
    simulator.clearStatusLines();
    int[] sockets = handler.startSnmpNetwork(new int[] {1, 2}, strings("t1", "t2"),
        strings("300.0.2.1", "300.0.2.2"), new int[] {161, 65536 + 162}, strings("public,,x", "public"),
        strings("private", "private"), new int[] {0, 0}, "db", new int[] {0, 0});
    assertArrayEquals(new int[] {0, 0}, sockets);
    assertTrue(simulator.statusLines().contains(String.format(NOT_STARTED, 161, "300.0.2.1")));
    assertTrue(simulator.statusLines().contains(String.format(NOT_STARTED, 162, "300.0.2.2")),
        "ports are 16-bit");
    assertEquals(-1, modeInfo.GetAgentID("300.0.2.1", "161"), "an agent that did not open is dropped");

    int[] opened = handler.startSnmpNetwork(new int[] {3}, strings("t3"), strings("127.0.0.3"),
        new int[] {65536 + 17161}, strings("public"), strings("private"), new int[] {1}, "db",
        new int[] {0});
    assertTrue(opened[0] > 0, "a loopback agent opens its socket");
    assertTrue(simulator.statusLines().contains(
        "Snmp Agent Started at port : 17161 and at IPAddress : 127.0.0.3"));
    assertEquals(3, modeInfo.GetAgentID("127.0.0.3", "17161"));

    assertNull(handler.startSnmpNetwork(new int[] {1, 2}, strings("t1"), strings("127.0.0.1"),
        new int[] {161}, strings("p"), strings("p"), new int[] {0}, "db", new int[] {0}),
        "arrays shorter than the agent ids are refused");
    assertNull(handler.startSnmpNetwork(null, null, null, null, null, null, null, null, null));
  }

  @Test
  void registeredCellsAnswerGetNextGroupOid() {
    SnmpRegister register = new SnmpRegister();
    int before = handler.jnistoreTreeCellReferences();
    assertTrue(register.JniCreateTreeCell("system", null, "V2", ".1.3.6.1.2.1.1.1", 3,
        strings("1", "2", "3"), strings("4", "6", "67"), strings("43690", "43690", "43690"), false, 0,
        null));
    assertTrue(register.JniCreateTreeCell("ifEntry", null, "V2", ".1.3.6.1.2.1.2.2.1", 2,
        strings("1", "2"), strings("2", "4"), strings("43690", "43690"), true, 0,
        strings("InterfaceIndex", "DisplayString")));
    assertFalse(register.JniCreateTreeCell("short", null, "V2", ".1.3.6.1.4.1.1", 3,
        strings("1"), strings("2"), strings("43690"), false, 0, null));
    assertTrue(register.JniCreateTreeCell("last", null, "V2", ".1.3.6.1.9.9.9.1", 1,
        strings("1"), strings("2"), strings("43690"), false, 0, null));
    assertEquals(before + 3, handler.jnistoreTreeCellReferences());
    assertEquals(".1.3.6.1.2.1.2.2.1", handler.GetNextGroupOid(".1.3.6.1.2.1.1.1.0"));
    assertNull(handler.GetNextGroupOid(".1.3.6.1.9.9.9.1.0"), "the last cell has no next");
  }

  @Test
  void reportsStartEmpty() {
    ReportsUI reports = new ReportsUI();
    assertEquals(28, reports.getReportOverviewDetails().length);
    assertArrayEquals(new int[] {0}, reports.getErrorLogs());
    assertArrayEquals(new String[2], reports.getIpAddrArr(2));
  }
}
