package com.kestrelon.simulator.tessel.cli;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrelon.simulator.tessel.control.AgentState;
import com.kestrelon.simulator.tessel.control.DeviceTable;
import com.kestrelon.simulator.tessel.network.Network;
import com.kestrelon.simulator.tessel.network.Network.Cli;
import com.kestrelon.simulator.tessel.network.Network.Group;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.List;
import java.util.Map;
import java.util.Optional;
import java.util.OptionalInt;
import java.util.Set;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;

/** How the network's CLI groups are handed to the engine and their devices opened, stopped and reloaded. */
class CliNetworkTest {
  /** The engine's side, recorded: which calls came, in order, and which listeners open. */
  private static final class Engine extends CliHandler {
    final List<String> calls = new ArrayList<>();
    Set<String> refusing = Set.of();

    @Override
    public boolean jniJVMParams() {
      calls.add("jvm");
      return true;
    }

    @Override
    public boolean initCliThread() {
      calls.add("service");
      return true;
    }

    @Override
    public void setCliLoginPrompt(String prompt) {
      calls.add("login '" + prompt + "'");
    }

    @Override
    public void setCliPasswordPrompt(String prompt) {
      calls.add("password '" + prompt + "'");
    }

    @Override
    public void setCliPromptString(String prompt) {
      calls.add("prompt " + prompt);
    }

    @Override
    public void setSSHKeyPath(String directory) {
      calls.add("keys " + Files.isDirectory(Path.of(directory)));
    }

    @Override
    public void setUserAddedModesAndNames() {
      calls.add("modes");
    }

    @Override
    public int nativePassCliAgentInfo(String userName, String password, String enablePassword, String ipAddress,
        int port, String hostText1, String hostText2, String hostText3, String hostText4, String deviceName,
        int hostNumber, int hostInt) {
      calls.add("agent " + String.join(" ", userName, password, enablePassword, ipAddress + ":" + port, hostText1,
          hostText2, deviceName, "" + hostNumber));
      return 1;
    }

    @Override
    public int[] startCliNetwork(String[] ipAddresses, int[] ports, int telnetServerFlag, int hostInt1, int hostInt2) {
      calls.add("start " + Arrays.toString(ipAddresses) + " " + Arrays.toString(ports));
      return Arrays.stream(ipAddresses).mapToInt(address -> refusing.contains(address + ":" + ports[0]) ? 0 : 1)
          .toArray();
    }

    @Override
    public boolean startSshListener(String ipAddress, int sshPort, int cliPort) {
      calls.add("ssh " + ipAddress + ":" + sshPort + " for " + cliPort);
      return !refusing.contains(ipAddress + ":" + sshPort);
    }

    @Override
    public boolean stopCLIAgent(String ipAddress, int port, int telnetServerFlag) {
      calls.add("stop " + ipAddress + ":" + port);
      return true;
    }
  }

  @TempDir
  Path dir;

  private final Engine engine = new Engine();
  private Group routers;

  private CliNetwork network(String data) throws Exception {
    CliData cliData = CliData.parse("r.cli", data);
    Cli cli = new Cli(2323, OptionalInt.of(2222), Path.of("r.cli"), cliData, "admin", "secret", "en", "n.yaml:5");
    Group snmpOnly = new Group("snmp", 2, 0x7F000101L, "S{n}", Optional.of(new Network.Snmp(1161, Path.of("d"),
        Optional.empty(), "public", "private")));
    routers = new Group("routers", 2, 0x7F000301L, "R{n}", Optional.empty(), List.of(), List.of(),
        Optional.empty(), Optional.of(cli));
    return new CliNetwork(new Network(new Network.Log(0, dir.resolve("log")), Optional.empty(), dir.resolve("state"),
        List.of(snmpOnly, routers)), engine, dir);
  }

  private static final String DATA = "[user, enable]\nshow version \"v\"\n| Version 1\n[enable]\n"
      + "write memory \"w\" => write\n[config]\n"
      + "hostname WORD \"name\" => hostname\n[running-config]\nhostname Router\n";

  @Test
  void registersTheHostAndOpensEachDeviceWithTelnetThenSsh() throws Exception {
    CliNetwork cli = network(DATA);
    assertEquals(Optional.empty(), cli.register());
    assertEquals(List.of("jvm", "login 'Username: '", "password 'Password: '", "prompt $DEVICENAME>", "keys true",
        "service"), engine.calls);
    assertTrue(Files.notExists(dir.resolve(CliNetwork.MODES_FILE)), "no added modes, no mode file");
    engine.calls.clear();
    engine.refusing = Set.of("127.0.3.2:2222");
    List<Optional<String>> outcomes = cli.startAgents(routers, 0, 2);
    assertEquals(Optional.empty(), outcomes.get(0));
    assertTrue(outcomes.get(1).orElseThrow().contains("TCP port 2222 on 127.0.3.2"), outcomes.toString());
    assertEquals(List.of("agent admin secret en 127.0.3.1:2323 routers 127.0.3.1 R1 2",
        "agent admin secret en 127.0.3.2:2323 routers 127.0.3.2 R2 3", "start [127.0.3.1, 127.0.3.2] [2323, 2323]",
        "ssh 127.0.3.1:2222 for 2323", "ssh 127.0.3.2:2222 for 2323", "stop 127.0.3.2:2323"), engine.calls,
        "the Telnet listener of a device whose SSH port failed closes");
  }

  @Test
  void aRestartThroughTheDeviceTableReloadsTheStartupConfiguration() throws Exception {
    CliNetwork cli = network(DATA);
    cli.register();
    DeviceTable devices = new DeviceTable.Builder()
        .add(0x7F000301L, 2, "R1", "routers", Map.of("cli", AgentState.RUNNING)).build(Map.of("cli", cli));
    engine.enterResponseMethod("hostname Saved", CliData.CONFIG, "routers", "127.0.3.1", "", "", "127.0.3.1", 2323);
    engine.enterResponseMethod("write memory", CliData.ENABLE, "routers", "127.0.3.1", "", "", "127.0.3.1", 2323);
    engine.enterResponseMethod("hostname Lost", CliData.CONFIG, "routers", "127.0.3.1", "", "", "127.0.3.1", 2323);
    engine.calls.clear();
    devices.restart("127.0.3.1", Optional.empty());
    assertEquals("stop 127.0.3.1:2323", engine.calls.get(0));
    assertEquals("agent admin secret en 127.0.3.1:2323 routers 127.0.3.1 Saved 2", engine.calls.get(1));
    assertTrue(engine.runningConfig("127.0.3.1").orElseThrow().contains("\nhostname Saved\n"));
  }

  @Test
  void addedModesAreWrittenWhereTheEngineReadsThem() throws Exception {
    CliNetwork cli = network("mode dhcp 16 (dhcp-config)#\n" + DATA);
    assertEquals(Optional.empty(), cli.register());
    assertTrue(engine.calls.contains("modes"));
    assertEquals("dhcp=16\n", Files.readString(dir.resolve(CliNetwork.MODES_FILE)));
    assertEquals("dhcp=(dhcp-config)#;\n", Files.readString(dir.resolve(CliNetwork.PROMPTS_FILE)));
  }
}
