package com.kestrelon.simulator.tessel.cli;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertNull;
import static org.junit.jupiter.api.Assertions.assertTrue;

import java.nio.file.Path;
import java.util.ArrayList;
import java.util.List;
import java.util.concurrent.ExecutorService;
import java.util.concurrent.Executors;
import java.util.concurrent.Future;
import java.util.concurrent.TimeUnit;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

/**
 * The host methods as the engine calls them, on two devices of the shipped router: what each line
 * means in each mode, the help and completion, and each device's configuration.
 */
class CliHandlerTest {
  private static final String R1 = "127.0.3.1";
  private static final String R2 = "127.0.3.2";
  private static final String GI1 = "interface GigabitEthernet0/1";
  private CliHandler handler;

  @BeforeEach
  void serveTwoRouters() throws Exception {
    CliData router = CliData.load(Path.of(System.getProperty("tessel.profiles.dir", "profiles"), "router.cli"));
    handler = new CliHandler();
    handler.addDevice(R1, router, "R1");
    handler.addDevice(R2, router, "R2");
  }

  /** The reply as key=value pairs joined by " | "; "null" for none. */
  private String enter(String address, int mode, String context, String line) {
    String[] reply = handler.enterContextResponseMethod(line, mode, "routers", address, "", "", address, 2323, context);
    if (reply == null) {
      return "null";
    }
    List<String> pairs = new ArrayList<>();
    for (int i = 0; i < reply.length; i += 2) {
      pairs.add(reply[i] + "=" + reply[i + 1]);
    }
    return String.join(" | ", pairs);
  }

  private String r1(int mode, String line) {
    return enter(R1, mode, mode >= CliData.INTERFACE ? GI1 : "", line);
  }

  private String config(String address) {
    return handler.runningConfig(address).orElseThrow();
  }

  @ParameterizedTest(name = "[{0}] {1}")
  @CsvSource(delimiter = ';', quoteCharacter = '`', value = {
      "6; conf t;                 level=7",
      "6; config term;            level=7",
      "7; int gi0/1;              level=9 | context=interface GigabitEthernet0/1",
      "7; interface Lo0;          level=9 | context=interface Loopback0",
      "7; router ospf 1;          level=10 | context=router ospf 1",
      "7; line vty 0 4;           level=11 | context=line vty 0 4",
      "7; vlan 10;                level=12 | context=vlan 10",
      "9; int gi0/2;              level=7 | level=9 | context=interface GigabitEthernet0/2",
      "9; hostname Edge;          level=7 | devicename=Edge",
      "5; enable;                 level=6",
      "6; disable;                level=5",
      "5; exit;                   level=8",
      "6; logout;                 level=8",
      "7; exit;                   level=6",
      "11; exit;                  level=7",
      "9; end;                    level=6",
      "5; terminal length 0;      null",
      "6; terminal width 511;     null",
      "5; terminal no monitor;    null",
      "6; sh;                     response=% Incomplete command.",
      "6; c;                      response=% Ambiguous command:  \"c\"",
      "5; t  l 0;                 response=% Ambiguous command:  \"t  l 0\"",
      "6; show verzion;           response=           ^\\n% Invalid input detected at '^' marker.",
      "5; show ip int brief zz;   response=                     ^\\n% Invalid input detected at '^' marker.",
      "5; conf t;                 response=   ^\\n% Invalid input detected at '^' marker.",
      "9; ip address 1.2.3.4 x y; response=                                   ^\\n% Invalid input detected at '^' marker.",
      "7; do sh verz;             response=                    ^\\n% Invalid input detected at '^' marker.",
      "7; interface gx0/1;        response=                      ^\\n% Invalid input detected at '^' marker.",
      "7; vlan 1o;                response=                 ^\\n% Invalid input detected at '^' marker."})
  void eachLineMeansWhatARouterMakesOfIt(int mode, String line, String expected) {
    assertEquals(expected.replace("\\n", "\n"), r1(mode, line));
  }

  @Test
  void helpListsWhatMayComeAndTabCompletesAUniquePrefix() {
    assertEquals("  show  Show running system information", handler.questionResponseMethod("sh", 5, "routers", R1));
    String next = handler.questionResponseMethod("show ip ", 6, "routers", R1);
    assertEquals("  interface  Brief summary of IP status and configuration\n  ospf       Neighbor list\n"
        + "  route      IP routing table", next);
    assertEquals("  <cr>", handler.questionResponseMethod("show ip interface brief ", 6, "routers", R1));
    assertTrue(handler.questionResponseMethod("", 9, "routers", R1).contains("\n  shutdown     Shutdown the selected"));
    assertTrue(handler.questionResponseMethod("show interfaces ", 5, "routers", R1).endsWith("\n  <cr>"));
    assertEquals(CliMatcher.UNRECOGNIZED, handler.questionResponseMethod("frob ", 5, "routers", R1));
    assertEquals(List.of("show ", "conf terminal ", "int GigabitEthernet", "c", "write mem"), List.of(
        handler.tabResponseMethod("sh", 5, "routers", R1), handler.tabResponseMethod("conf t", 6, "routers", R1),
        handler.tabResponseMethod("int gi", 7, "routers", R1), handler.tabResponseMethod("c", 6, "routers", R1),
        handler.tabResponseMethod("write mem", 6, "routers", "127.9.9.9")));
  }

  @Test
  void showVersionAndTheProfilesInterfaces() {
    assertTrue(r1(5, "sh ver").contains("Version 15.2"));
    assertTrue(r1(5, "sh ver").contains("\nR1 uptime is"));
    String brief = r1(5, "show ip interface brief");
    for (String line : List.of("GigabitEthernet0/1         192.168.1.1     YES manual up                    up",
        "GigabitEthernet0/4         unassigned      YES unset  administratively down down")) {
      assertTrue(brief.contains("\n" + line), brief);
    }
  }

  @Test
  void configurationCommandsChangeTheirDeviceAlone() {
    List<String> session = List.of("int gi0/1", "desc  to core  ", "ip add 10.1.1.1 255.255.255.0", "shut",
        "int gi0/3", "description spare", "no shut", "ip address 10.3.3.1 255.255.255.128", "exit",
        "ip route 10.9.0.0 255.255.0.0 10.1.1.2", "ntp server 10.0.0.9", "router ospf 1", "no network 10.0.0.0 0.0.0.3 area 0",
        "network 10.1.1.0 0.0.0.255 area 0", "int gi0/2", "no desc", "no ip address", "interface Loopback7", "exit",
        "no int lo7", "hostname Core-1");
    int mode = CliData.CONFIG;
    String context = "";
    for (String line : session) {
      String[] reply = handler.enterContextResponseMethod(line, mode, "routers", R1, "", "", R1, 2323, context);
      for (int i = 0; reply != null && i < reply.length; i += 2) {
        assertFalse(reply[i].equals("response"), line + ": " + reply[i + 1]);
        mode = reply[i].equals("level") ? Integer.parseInt(reply[i + 1]) : mode;
        context = reply[i].equals("context") ? reply[i + 1] : reply[i].equals("level") ? "" : context;
      }
    }
    String config = config(R1);
    for (String expected : List.of("!\nhostname Core-1\n!\n", "interface GigabitEthernet0/1\n description to core\n"
        + " ip address 10.1.1.1 255.255.255.0\n duplex auto\n speed auto\n shutdown\n!\n",
        "interface GigabitEthernet0/2\n ip ospf cost 10\n duplex auto\n speed auto\n!\n",
        "interface GigabitEthernet0/3\n ip address 10.3.3.1 255.255.255.128\n duplex auto\n speed auto\n description spare\n!\n",
        "router ospf 1\n router-id 10.0.0.1\n network 192.168.1.0 0.0.0.255 area 0\n passive-interface GigabitEthernet0/1\n"
            + " network 10.1.1.0 0.0.0.255 area 0\n!\n",
        "ip route 0.0.0.0 0.0.0.0 10.0.0.2\nip route 10.9.0.0 255.255.0.0 10.1.1.2\n!\n", "ntp server 10.0.0.2\nntp server 10.0.0.9\n!\n")) {
      assertTrue(config.contains(expected), expected + "\nnot in\n" + config);
    }
    assertFalse(config.contains("Loopback7"), config);
    for (String again : List.of("description to core", "ip address 10.1.1.1 255.255.255.0", "shutdown")) {
      enter(R1, CliData.INTERFACE, GI1, again);
    }
    enter(R1, CliData.CONFIG, "", "ip domain-name lab.example.net");
    assertEquals(config, config(R1), "the same lines again change nothing");
    assertTrue(config.endsWith("\n!\nend"), config);
    String brief = r1(6, "sh ip int br");
    assertTrue(brief.contains("\nGigabitEthernet0/1         10.1.1.1        YES manual administratively down down"), brief);
    assertTrue(brief.contains("\nGigabitEthernet0/2         unassigned      YES unset  up                    up"), brief);
    assertTrue(brief.contains("\nGigabitEthernet0/3         10.3.3.1        YES manual up                    up"), brief);
    assertTrue(r1(6, "show interfaces gi0/3").startsWith("response=GigabitEthernet0/3 is up, line protocol is up\n"));
    assertTrue(r1(6, "show interfaces gi0/3").contains("\n  Description: spare\n  Internet address is 10.3.3.1/25\n"));
    assertTrue(config(R2).contains("hostname R2\n") && config(R2).contains(" description LAN\n"), config(R2));
    assertFalse(config(R2).contains("10.1.1.1"));
  }

  @Test
  void writeMemoryKeepsTheConfigurationAReloadGoesBackTo() {
    r1(7, "hostname Saved");
    assertEquals("response=Building configuration...\n[OK]", r1(6, "wr mem"));
    r1(7, "hostname Unsaved");
    r1(7, "logging host 10.0.0.50");
    assertTrue(r1(6, "show startup-config").contains("\nhostname Saved\n"));
    assertTrue(config(R1).contains("\nhostname Unsaved\n") && config(R1).contains("\nlogging host 10.0.0.50\n"));
    assertEquals(List.of("Saved", "R2"), List.of(handler.reload(R1).orElseThrow(), handler.reload(R2).orElseThrow()));
    assertTrue(config(R1).contains("\nhostname Saved\n") && !config(R1).contains("logging host"), config(R1));
    r1(7, "hostname Again");
    assertTrue(r1(6, "show startup-config").contains("\nhostname Saved\n"), "a reload keeps the startup configuration");
    assertTrue(r1(6, "show running-config").startsWith("response=Building configuration...\n\nCurrent configuration : "));
  }

  @Test
  void sessionsConfigureOneDeviceAtTheSameTime() throws Exception {
    ExecutorService sessions = Executors.newFixedThreadPool(4);
    try {
      List<Future<?>> done = new ArrayList<>();
      for (int s = 0; s < 4; s++) {
        String block = "interface Loopback" + s;
        done.add(sessions.submit(() -> {
          for (int i = 0; i < 200; i++) {
            handler.enterContextResponseMethod("ip route 10." + i + ".0.0 255.255.0.0 " + block.substring(18), 7,
                "routers", R1, "", "", R1, 2323, "");
            handler.enterContextResponseMethod("description d" + i, 9, "routers", R1, "", "", R1, 2323, block);
          }
        }));
      }
      for (Future<?> session : done) {
        session.get(30, TimeUnit.SECONDS);
      }
    } finally {
      sessions.shutdownNow();
    }
    String config = config(R1);
    for (int s = 0; s < 4; s++) {
      assertTrue(config.contains("interface Loopback" + s + "\n description d199\n!\n"), config);
      assertTrue(config.contains("ip route 10.199.0.0 255.255.0.0 " + s + "\n"));
    }
    assertEquals(1 + 4 * 200, config.split("\nip route ", -1).length - 1);
  }

  @Test
  void anUnknownDeviceOrABlankLineAnswersNothing() {
    assertNull(handler.enterResponseMethod("show version", 5, "routers", "127.9.9.9", "", "", "127.9.9.9", 2323));
    assertNull(handler.enterResponseMethod("   ", 5, "routers", R1, "", "", R1, 2323));
  }
}
