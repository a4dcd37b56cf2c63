package com.kestrelon.simulator.tessel;

import static java.nio.charset.StandardCharsets.UTF_8;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;
import static org.junit.jupiter.api.Assertions.fail;

import com.kestrelon.simulator.tessel.control.AgentState;
import com.kestrelon.simulator.tessel.control.Device;
import com.kestrelon.simulator.tessel.control.DeviceTable;
import com.kestrelon.simulator.tessel.network.Network;
import java.io.ByteArrayOutputStream;
import java.io.IOException;
import java.io.PrintStream;
import java.net.DatagramSocket;
import java.net.InetAddress;
import java.net.InetSocketAddress;
import java.net.ServerSocket;
import java.net.Socket;
import java.net.URI;
import java.net.http.HttpClient;
import java.net.http.HttpRequest;
import java.net.http.HttpResponse;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.List;
import java.util.Optional;
import java.util.concurrent.atomic.AtomicBoolean;
import java.util.concurrent.atomic.AtomicInteger;
import java.util.concurrent.atomic.AtomicReference;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

/** The command line of ./tessel run, its exit statuses, and real starts and stops. */
class LauncherTest {
  private final ByteArrayOutputStream out = new ByteArrayOutputStream();
  private final ByteArrayOutputStream err = new ByteArrayOutputStream();

  /** Runs a launch on a thread of its own; its exit status goes to status. */
  private Thread startNetwork(Launcher launcher, AtomicInteger status, String... args) {
    Thread network = new Thread(() -> status.set(launcher.run(args,
        new PrintStream(out, true, UTF_8), new PrintStream(err, true, UTF_8))));
    network.start();
    return network;
  }

  /** Runs a launch that must end by itself; one that serves instead is stopped and fails the test. */
  private int runToEnd(String... args) throws InterruptedException {
    Launcher launcher = new Launcher();
    AtomicInteger status = new AtomicInteger(-1);
    Thread network = startNetwork(launcher, status, args);
    network.join(10_000);
    if (network.isAlive()) {
      launcher.requestStop();
      network.join(5_000);
      fail("the launch did not end by itself: " + out());
    }
    return status.get();
  }

  /** Waits, 10 s at most, until the network serves (its summary line) or the launch has ended. */
  private void awaitServing(Thread network) throws InterruptedException {
    long deadline = System.nanoTime() + 10_000_000_000L;
    while (!err().contains(" devices running: ") && System.nanoTime() < deadline && network.isAlive()) {
      Thread.sleep(20);
    }
  }

  private String out() {
    return out.toString(UTF_8);
  }

  private String err() {
    return err.toString(UTF_8);
  }

  private static boolean bindable(String address, int port) {
    try (DatagramSocket socket = new DatagramSocket(new InetSocketAddress(address, port))) {
      return socket.isBound();
    } catch (IOException e) {
      return false;
    }
  }

  /** Runs action on a thread of its own; true when it ended within 5 s. */
  private static boolean endsSoon(Runnable action) {
    Thread thread = new Thread(action);
    thread.start();
    try {
      thread.join(5_000);
    } catch (InterruptedException e) {
      Thread.currentThread().interrupt();
    }
    return !thread.isAlive();
  }

  @ParameterizedTest
  @CsvSource(delimiter = ';', value = {
      "--bogus;                    Unknown option: '--bogus'",
      "--devices;                  Missing required parameter for option '--devices'",
      "--devices 0;                --devices takes a number from 1",
      "--snmp-data=;               --snmp-data needs a value",
      "--snmp-port 65535;          --snmp-port takes a number from 1 to 65534",
      "--tl1-keepalive 5;          --tl1-keepalive needs --tl1-data",
      "--tl1-data t.tl1 --tl1-port 65536; --tl1-port takes a number from 1 to 65535",
      "--tl1-data=;                --tl1-data needs a value",
      "--ssh-port 2222;            --ssh-port needs --cli-data",
      "--cli-data r.cli --cli-port 2222 --ssh-port 2222; --cli-port, --ssh-port and --tl1-port need different ports",
      "--address 127.0.1.256;      --address takes an IPv4 address such as 127.0.1.1, not '127.0.1.256'",
      "--read-community a,b;       --read-community takes a non-empty community without ','",
      "--admin 127.0.0.1;          --admin takes HOST:PORT",
      "--admin 0.0.0.0:28160;      the control interface listens on 0.0.0.0, which is not a loopback address",
      "--network n.yaml --devices=2; --network cannot be mixed with --devices",
      "--address 255.255.255.254 --devices 3; 3 devices from 255.255.255.254 run past 255.255.255.255"})
  void usageErrorsExitWithStatusTwo(String args, String message) throws Exception {
    assertEquals(2, runToEnd(args.split(" ")));
    assertTrue(err().startsWith("tessel: " + message), err());
    assertEquals("", out());
  }

  @Test
  void helpGoesToStandardOutput() throws Exception {
    assertEquals(0, runToEnd("--devices", "5", "--help"));
    assertEquals(LaunchOptions.usage(), out());
    assertEquals("", err());
  }

  @Test
  void fileFaultsExitWithStatusTwoBeforeAnythingStarts(@TempDir Path dir) throws Exception {
    Path bad = dir.resolve("bad.snmprec");
    Files.writeString(bad, "1.3.6.1.2.1.1.1.0|4|ok\n1.3.6.1.2.1.1.2.0|99|no such tag\n");
    assertEquals(2, runToEnd("--snmp-data", bad.toString()));
    assertTrue(err().startsWith(bad + ":2: "), err());
    for (String option : List.of("--snmp-data", "--snmpv3")) {
      err.reset();
      assertEquals(2, runToEnd(option, dir.resolve("missing").toString()));
      assertEquals(dir.resolve("missing") + ": no such file", err().strip(), option);
    }
    Path network = dir.resolve("network.yaml");
    Files.writeString(network, "groups:\n  - name: a\n    count: 0\n");
    err.reset();
    assertEquals(2, runToEnd("--network", network.toString()));
    assertTrue(err().startsWith(network + ":3: count takes a whole number from 1"), err());
    Path tl1 = Files.writeString(dir.resolve("bad.tl1"), "[RTRV-HDR]\nCOMPLETE\n");
    err.reset();
    assertEquals(2, runToEnd("--tl1-data", tl1.toString()));
    assertTrue(err().startsWith(tl1 + ":2: unknown completion code"), err());
    assertEquals("", out());
  }

  @Test
  void tl1FlagsDescribeTheOneGroupNamedForItsSids(@TempDir Path dir) throws Exception {
    Path data = Files.writeString(dir.resolve("optical.tl1"), "[RTRV-HDR]\nCOMPLD\n");
    Network.Group alone = LaunchOptions.parse(new String[] {"--tl1-data", data.toString(), "--tl1-port", "4000",
        "--tl1-keepalive", "30"}).network(Path.of("unused.yaml")).groups().get(0);
    assertEquals(List.of("optical", "false", "4000", "30", "[RTRV-HDR]", "NE2"), List.of(alone.name(),
        "" + alone.snmp().isPresent(), "" + alone.tl1().get().port(), "" + alone.tl1().get().keepAlive(),
        "" + alone.tl1().get().data().codes(), alone.deviceName(1)));
    Network.Group both = LaunchOptions.parse(new String[] {"--tl1-data", data.toString(), "--snmp-port", "2161"})
        .network(Path.of("unused.yaml")).groups().get(0);
    assertEquals(List.of("router", "2161", "3083"),
        List.of(both.name(), "" + both.snmp().get().port(), "" + both.tl1().get().port()));
  }

  @Test
  void cliFlagsDescribeTheOneGroupOfRoutersNamedForTheirHostnames(@TempDir Path dir) throws Exception {
    Path data = Files.writeString(dir.resolve("edge.cli"), "[user]\nshow version \"v\"\n");
    Network.Group alone = LaunchOptions.parse(new String[] {"--cli-data", data.toString(), "--ssh-port", "2222",
        "--cli-user", "ops", "--cli-enable", ""}).network(Path.of("unused.yaml")).groups().get(0);
    Network.Cli cli = alone.cli().orElseThrow();
    assertEquals(List.of("edge", "false", "R2", "2323", "2222", "ops", "admin", ""), List.of(alone.name(),
        "" + alone.snmp().isPresent(), alone.deviceName(1), "" + cli.port(), "" + cli.sshPort().getAsInt(), cli.user(),
        cli.password(), cli.enable()));
  }

  @Test
  void noDeviceStartedExitsWithStatusOne() throws Exception {
    String nowhere = "203.0.113.1"; // a documentation address, on no interface of a test machine
    assertFalse(bindable(nowhere, 0), "this machine has " + nowhere);
    assertEquals(1, runToEnd("--address", nowhere, "--devices", "1", "--snmp-port", "28161", "--admin", "off"));
    assertTrue(out().contains("Unable to start SNMP Agent at Port : 28161 and at IpAddress : " + nowhere), out());
    assertTrue(out().contains("Network resources cleared Successfully"));
    assertEquals("tessel: no device started", err().strip());
  }

  @Test
  void servesTheDevicesThatFitUntilStoppedOnce() throws Exception {
    // One device more than a registration call takes fits: the network is started in two calls.
    int fit = Launcher.AGENTS_PER_CALL + 1;
    DescriptorBudget budget = new DescriptorBudget(1000, 1000, 1000 - DescriptorBudget.RESERVE - fit);
    // A stop request that comes while the engine stops returns at once: the launcher does not
    // hold its lock while the engine waits for its threads.
    AtomicInteger stops = new AtomicInteger();
    AtomicBoolean secondRequestReturned = new AtomicBoolean();
    AtomicReference<Launcher> launcher = new AtomicReference<>();
    launcher.set(new Launcher(() -> Optional.of(budget), status -> new NetworkSimulator(status, 0) {
      @Override
      public boolean AdapterJniStopNetwork() {
        if (stops.incrementAndGet() == 1) {
          secondRequestReturned.set(endsSoon(launcher.get()::requestStop));
        }
        return super.AdapterJniStopNetwork();
      }
    }));
    AtomicInteger status = new AtomicInteger(-1);
    Thread network = startNetwork(launcher.get(), status, "--devices", String.valueOf(fit + 2),
        "--address", "127.0.3.1", "--snmp-port", "28162", "--admin", "off");
    try {
      // What the devices answer is the integration tests' part (tests/integration).
      awaitServing(network);
    } finally {
      launcher.get().requestStop();
      network.join(5000);
    }
    assertFalse(network.isAlive());
    assertEquals(0, status.get());
    assertEquals(fit, out().split("Snmp Agent Started").length - 1, out());
    assertTrue(out().contains("Snmp Agent Started at port : 28162 and at IPAddress : 127.0.4.1\n"));
    assertTrue(out().endsWith("Network resources cleared Successfully\n"));
    assertEquals(budget.shortfall(fit + 2) + "\n" + fit + " devices running: router " + fit + "/" + (fit + 2)
        + " (2 failed)", err().strip());
    assertTrue(err().startsWith("tessel: the open-file limit allows " + fit + " agents, not " + (fit + 2)), err());
    assertTrue(secondRequestReturned.get(), "a second stop request waited for the first");
    launcher.get().requestStop();
    assertEquals(1, stops.get(), "the engine is stopped once");
  }

  @Test
  void groupsOfANetworkFileServeTheirOwnDataAndDevicesStopAndStartOneByOne(@TempDir Path dir) throws Exception {
    Path hosts = Path.of(System.getProperty("tessel.data.dir"), "linux-host.walk");
    Path tl1 = Files.writeString(dir.resolve("optical.tl1"), "[RTRV-HDR]\nCOMPLD\n");
    Path network = dir.resolve("network.yaml");
    Files.writeString(network, String.join("\n", "admin: off", "log: {file: logs/engine.log}", "groups:",
        "  - {name: routers, count: 2, address: 127.0.3.1, device-name: 'R{n}',",
        "     snmp: {port: 28163, data: " + Launcher.defaultData().toAbsolutePath() + "}}",
        "  - {name: hosts, count: 1, address: 127.0.3.9, snmp: {port: 28165, data: " + hosts + "}}",
        "  - {name: optical, count: 2, address: 127.0.9.11, device-name: 'NE{n}', tl1: {port: 28175, data: " + tl1
            + "}}", ""));
    ServerSocket squatter = new ServerSocket(28175, 1, InetAddress.getByName("127.0.9.12"));
    Launcher launcher = new Launcher();
    AtomicInteger status = new AtomicInteger(-1);
    Thread running = startNetwork(launcher, status, "--network", network.toString(), "--admin", "127.0.0.1:0");
    String api;
    try {
      awaitServing(running);
      String[] lines = err().strip().split("\n");
      assertEquals("4 devices running: routers 2/2, hosts 1/1, optical 1/2 (1 failed)", lines[1]);
      api = lines[0].replaceFirst("^control interface: ", "") + "api/";
      assertTrue(fetch(api + "network").contains("\"devices\":5,\"running\":4"), fetch(api + "network"));
      assertTrue(Files.isDirectory(dir.resolve("logs")), "the log's folder is made, relative to the file");
      DeviceTable devices = launcher.devices();
      assertEquals("R2 routers {snmp=RUNNING}", describe(devices.find("127.0.3.2").orElseThrow()));
      assertEquals("127.0.3.9 hosts {snmp=RUNNING}", describe(devices.find("127.0.3.9").orElseThrow()));
      // Agent ids run through the groups: the routers are 0 and 1, the host 2, the optical devices 3 and 4.
      Device first = devices.find("127.0.9.11").orElseThrow();
      Device second = devices.find("127.0.9.12").orElseThrow();
      assertEquals("NE1 optical {tl1=RUNNING} 3", describe(first) + " " + first.agentId());
      assertEquals("NE2 optical {tl1=FAILED} 4", describe(second) + " " + second.agentId());
      assertTrue(out().contains("TL1 Agent started at Port : 28175, IpAddress : 127.0.9.11"), out());
      squatter.close();
      assertEquals(Optional.empty(), devices.start("127.0.9.12", Optional.of("tl1")).orElseThrow().failure());
      try (Socket client = new Socket("127.0.9.12", 28175)) {
        assertTrue(client.isConnected(), "a device started again listens");
      }

      // A stopped device gives its port back: another socket takes it, and the device cannot start.
      devices.stop("127.0.3.1", Optional.empty());
      try (DatagramSocket taken = new DatagramSocket(new InetSocketAddress("127.0.3.1", 28163))) {
        assertTrue(taken.isBound());
        DeviceTable.Change change = devices.start("127.0.3.1", Optional.empty()).orElseThrow();
        assertTrue(change.failure().orElseThrow().contains("UDP port 28163 on 127.0.3.1"), change.toString());
        assertEquals(AgentState.FAILED, change.device().protocols().get("snmp"));
      }
      assertEquals(AgentState.RUNNING,
          devices.restart("127.0.3.1", Optional.empty()).orElseThrow().device().protocols().get("snmp"));
    } finally {
      squatter.close();
      launcher.requestStop();
      running.join(5000);
    }
    assertEquals(0, status.get());
    assertThrows(IOException.class, () -> fetch(api + "network"), "the control interface stops with the network");
  }

  private static String fetch(String url) throws IOException, InterruptedException {
    return HttpClient.newHttpClient().send(HttpRequest.newBuilder(URI.create(url)).build(),
        HttpResponse.BodyHandlers.ofString()).body();
  }

  private static String describe(Device device) {
    return device.name() + " " + device.group() + " " + device.protocols();
  }
}
