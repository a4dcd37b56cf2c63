package com.kestrelon.simulator.tessel.tl1;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrelon.simulator.tessel.network.Network;
import com.kestrelon.simulator.tessel.network.Network.Group;
import com.kestrelon.simulator.tessel.network.Network.Snmp;
import com.kestrelon.simulator.tessel.network.Network.Tl1;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.List;
import java.util.Optional;
import java.util.OptionalInt;
import java.util.Set;
import org.junit.jupiter.api.Test;

/** How the network's TL1 groups are registered with the engine and their devices opened. */
class Tl1NetworkTest {
  /** The engine's side, recorded: which calls came, in order, and which listeners open. */
  private static final class Engine extends TL1Register {
    final List<String> calls = new ArrayList<>();
    Set<String> refusing = Set.of();

    @Override
    public boolean registerTL1Commands(String commandCode) {
      calls.add("code " + commandCode);
      return true;
    }

    @Override
    public int KeepAliveTimeForTL1Agent(int seconds) {
      calls.add("keepalive " + seconds);
      return seconds;
    }

    @Override
    public int[] startTL1Network(int[] agentIds, String[] agentTexts, String[] ipAddresses, int[] ports,
        String networkText, String[] sids, int[] agentNumbers) {
      calls.add("start " + networkText + " " + Arrays.toString(agentIds) + " " + Arrays.toString(ipAddresses) + " "
          + Arrays.toString(ports) + " " + Arrays.toString(sids));
      return Arrays.stream(ipAddresses).mapToInt(address -> refusing.contains(address + ":" + ports[0]) ? 0 : 1)
          .toArray();
    }

    @Override
    public void setLoginRequired(int agentId, boolean required) {
      calls.add("login " + agentId + " " + required);
    }

    @Override
    public boolean startTelnetListener(String ipAddress, int port, int agentId) {
      calls.add("telnet " + ipAddress + ":" + port + " " + agentId);
      return !refusing.contains(ipAddress + ":" + port);
    }

    @Override
    public boolean stopAgent(String ipAddress, int port) {
      calls.add("stop " + ipAddress + ":" + port);
      return true;
    }
  }

  private static final class Handler extends TL1Handler {
    int cached;

    @Override
    public void nativeCacheThisObject(Object handler) {
      cached += handler == this ? 1 : 100;
    }
  }

  private final Engine engine = new Engine();
  private final Handler handler = new Handler();
  private final Group routers = new Group("routers", 3, 0x7F000101L, "R{n}",
      Optional.of(new Snmp(1161, Path.of("r.snmprec"), Optional.empty(), "public", "private")));
  private final Group optical;
  private final Group metro;
  private final Tl1Network tl1;

  Tl1NetworkTest() throws Exception {
    TL1Data optics = TL1Data.parse("o.tl1", "[RTRV-HDR]\nCOMPLD\n[ACT-USER]\nCOMPLD\n[RTRV-ALM]\nCOMPLD\n");
    TL1Data metroData = TL1Data.parse("m.tl1", "[RTRV-HDR]\nCOMPLD\n[ED-EQPT]\nCOMPLD\n");
    optical = group("optical", 2, 0x7F000201L, new Tl1(3083, OptionalInt.of(3023), 30, Path.of("o.tl1"), optics,
        List.of(new TL1User("admin", "admin")), true, "n.yaml:9"));
    metro = group("metro", 1, 0x7F000301L, new Tl1(4083, OptionalInt.empty(), 0, Path.of("m.tl1"), metroData,
        List.of(), false, "n.yaml:14"));
    Network network = new Network(new Network.Log(0, Path.of("log")), Optional.empty(), Path.of("state"),
        List.of(routers, optical, metro));
    tl1 = new Tl1Network(network, handler, engine);
  }

  private static Group group(String name, int count, long first, Tl1 section) {
    return new Group(name, count, first, "{n}-" + name.toUpperCase(), Optional.empty(), List.of(), List.of(),
        Optional.of(section));
  }

  @Test
  void registersEveryDeviceUnderItsNetworkWideIdAndEveryCodeOnce() {
    tl1.register();
    assertEquals(1, handler.cached);
    engine.calls.sort(null); // the order of codes does not matter to the engine; each comes once
    assertEquals(List.of("code ACT-USER", "code CANC-USER", "code ED-EQPT", "code RTRV-ALM", "code RTRV-HDR"),
        engine.calls);
    // Agent ids follow the SNMP-only group's three: optical is 3 and 4, metro 5.
    assertEquals(Optional.of("optical"), handler.group(4));
    assertEquals(Optional.of("metro"), handler.group(5));
    assertEquals(Optional.empty(), handler.group(2));
    String[] header = handler.getResponseBlock("RTRV", "ALM", null, "", null, 4, 0, "127.0.2.2", 3083, null, null,
        "", null);
    assertEquals("1", header[0], "the device answers from its group's data");
  }

  @Test
  void opensAGroupWithItsKeepAliveThenLoginAndTelnetPerDevice() {
    List<Optional<String>> outcomes = tl1.startAgents(optical, 0, 2);
    assertEquals(List.of(Optional.empty(), Optional.empty()), outcomes);
    assertEquals(List.of("keepalive 30",
        "start optical [3, 4] [127.0.2.1, 127.0.2.2] [3083, 3083] [1-OPTICAL, 2-OPTICAL]",
        "login 3 true", "telnet 127.0.2.1:3023 3", "login 4 true", "telnet 127.0.2.2:3023 4"), engine.calls);

    engine.calls.clear();
    assertEquals(List.of(Optional.empty()), tl1.startAgents(metro, 0, 1));
    assertEquals(List.of("keepalive 0", "start metro [5] [127.0.3.1] [4083] [1-METRO]"), engine.calls,
        "no login and no Telnet where the group asks for none");
  }

  @Test
  void aDeviceWhosePortsCannotOpenIsFailedAndHoldsNoHalfOfThem() {
    engine.refusing = Set.of("127.0.2.1:3083", "127.0.2.2:3023");
    List<Optional<String>> outcomes = tl1.startAgents(optical, 0, 2);
    assertTrue(outcomes.get(0).orElseThrow().contains("TCP port 3083 on 127.0.2.1"), outcomes.toString());
    assertTrue(outcomes.get(1).orElseThrow().contains("TCP port 3023 on 127.0.2.2"), outcomes.toString());
    assertEquals(List.of("login 4 true", "telnet 127.0.2.2:3023 4", "stop 127.0.2.2:3083"),
        engine.calls.subList(2, engine.calls.size()), "the raw listener of a device whose Telnet port failed closes");
  }
}
