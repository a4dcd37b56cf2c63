package com.kestrelon.simulator.tessel;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;
import static org.junit.jupiter.api.Assertions.fail;

import java.io.ByteArrayOutputStream;
import java.io.IOException;
import java.io.PrintStream;
import java.net.DatagramSocket;
import java.net.InetSocketAddress;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.Optional;
import java.util.concurrent.atomic.AtomicInteger;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

/** The command line of ./tessel run, its exit statuses, and one real start and stop. */
class LauncherTest {
  private static final Path DATA = Path.of("d.snmprec");
  private static final Path V3 = Path.of("v3.conf");

  private final ByteArrayOutputStream out = new ByteArrayOutputStream();
  private final ByteArrayOutputStream err = new ByteArrayOutputStream();

  private int run(Launcher launcher, String... args) {
    return launcher.run(args, new PrintStream(out, true, StandardCharsets.UTF_8),
        new PrintStream(err, true, StandardCharsets.UTF_8));
  }

  /** Runs a launch that must end by itself; one that serves instead is stopped and fails the test. */
  private int runToEnd(String... args) throws InterruptedException {
    Launcher launcher = new Launcher();
    AtomicInteger status = new AtomicInteger(-1);
    Thread thread = new Thread(() -> status.set(run(launcher, args)));
    thread.start();
    thread.join(10_000);
    if (thread.isAlive()) {
      launcher.requestStop();
      thread.join(5_000);
      fail("the launch did not end by itself: " + out());
    }
    return status.get();
  }

  /** Two consecutive documentation addresses that no interface of this machine has. */
  private static String unboundPair() {
    for (int last = 1; last < 250; last += 2) {
      if (!bindable("203.0.113." + last) && !bindable("203.0.113." + (last + 1))) {
        return "203.0.113." + last;
      }
    }
    throw new IllegalStateException("every 203.0.113.0/24 pair is bindable here");
  }

  private static boolean bindable(String address) {
    try (DatagramSocket socket = new DatagramSocket(new InetSocketAddress(address, 0))) {
      return socket.isBound();
    } catch (IOException e) {
      return false;
    }
  }

  /** Runs a launch on a thread of its own; its exit status goes to status. */
  private Thread startNetwork(Launcher launcher, AtomicInteger status, String... args) {
    Thread network = new Thread(() -> status.set(run(launcher, args)));
    network.start();
    return network;
  }

  /** Waits, 10 s at most, until devices have said they started or the launch has ended. */
  private void awaitStarted(Thread network, int devices) throws InterruptedException {
    long deadline = System.nanoTime() + 10_000_000_000L;
    while (out().split("Snmp Agent Started").length <= devices && System.nanoTime() < deadline
        && network.isAlive()) {
      Thread.sleep(20);
    }
  }

  private String out() {
    return out.toString(StandardCharsets.UTF_8);
  }

  private String err() {
    return err.toString(StandardCharsets.UTF_8);
  }

  @Test
  void optionsTakeTheirValuesInEitherFormAndDefaultsOtherwise() throws Exception {
    LaunchOptions defaults = LaunchOptions.parse(new String[0], DATA, V3);
    assertEquals(new LaunchOptions(DATA, V3, 100, 0x7F000101L, 1161, "public", "private", 0, "tessel.log", false),
        defaults);
    assertEquals("127.0.1.100", defaults.address(99));

    LaunchOptions set = LaunchOptions.parse(new String[] {"--snmp-data", "x.walk", "--snmpv3=u.conf", "--devices=3",
        "--address", "10.0.0.254", "--snmp-port=11161", "--read-community", "r", "--write-community=w",
        "--log-level", "3", "--log-file", "e.log"}, DATA, V3);
    assertEquals(new LaunchOptions(Path.of("x.walk"), Path.of("u.conf"), 3, 0x0A0000FEL, 11161, "r", "w", 3, "e.log", false), set);
    assertEquals("10.0.0.255", set.address(1), "addresses ending in .255 are used");
    assertEquals("10.0.1.0", set.address(2), "and carry into the next octet");

    LaunchOptions last = LaunchOptions.parse(new String[] {"--address", "255.255.255.254", "--devices", "2"}, DATA, V3);
    assertEquals("255.255.255.255", last.address(1));
    assertThrows(LaunchOptions.UsageException.class,
        () -> LaunchOptions.parse(new String[] {"--address", "255.255.255.254", "--devices", "3"}, DATA, V3));
  }

  @ParameterizedTest
  @CsvSource(delimiter = ';', value = {
      "--bogus;                    unknown option '--bogus'",
      "--devices;                  --devices needs a value",
      "--devices 0;                --devices takes a number from 1",
      "--snmp-port 65536;          --snmp-port takes a number from 1 to 65535",
      "--log-level 4;              --log-level takes a number from 0 to 3",
      "--address 127.0.1;          --address takes an IPv4 address",
      "--read-community a,b;       --read-community takes a non-empty community without ','",
      "--write-community=;         --write-community takes a non-empty community",
      "--snmp-data=;               --snmp-data needs a value",
      "--snmpv3;                   --snmpv3 needs a value"})
  void usageErrorsExitWithStatusTwo(String args, String message) throws Exception {
    assertEquals(2, runToEnd(args.split(" ")));
    assertTrue(err().startsWith("tessel: " + message), err());
    assertEquals("", out());
  }

  @Test
  void helpGoesToStandardOutput() throws Exception {
    assertEquals(0, runToEnd("--devices", "5", "--help"));
    assertTrue(out().startsWith("usage: ./tessel run [options]"));
    for (String option : new String[] {"--snmp-data", "--snmpv3", "--devices", "--address", "--snmp-port", "--read-community",
        "--write-community", "--log-level", "--log-file"}) {
      assertTrue(out().contains("  " + option + " "), option);
    }
    assertEquals("", err());
  }

  @Test
  void dataErrorsNameTheFileAndLine(@TempDir Path dir) throws Exception {
    Path bad = dir.resolve("bad.snmprec");
    Files.writeString(bad, "1.3.6.1.2.1.1.1.0|4|ok\n1.3.6.1.2.1.1.2.0|99|no such tag\n");
    assertEquals(2, runToEnd("--snmp-data", bad.toString()));
    assertTrue(err().startsWith(bad + ":2: "), err());

    err.reset();
    assertEquals(2, runToEnd("--snmp-data", dir.resolve("missing.walk").toString()));
    assertEquals(dir.resolve("missing.walk") + ": no such file", err().strip());
    assertEquals("", out());
  }

  @Test
  void snmpV3FaultsExitWithStatusTwoBeforeAnythingStarts(@TempDir Path dir) throws Exception {
    Path bad = dir.resolve("bad.conf");
    Files.writeString(bad, "user a NO_AUTH - NO_PRIV -\nuser b NO_AUTH - CBC_DES despassword\n");
    assertEquals(2, runToEnd("--snmpv3", bad.toString(), "--snmp-port", "28163"));
    assertEquals(bad + ":2: privacy needs authentication: NO_AUTH with CBC_DES", err().strip());
    assertEquals("", out(), "no device was started");

    err.reset();
    assertEquals(2, runToEnd("--snmpv3", dir.resolve("missing.conf").toString()));
    assertEquals(dir.resolve("missing.conf") + ": no such file", err().strip());
    assertEquals("", out());
  }

  @Test
  void noDeviceStartedExitsWithStatusOne() throws Exception {
    String first = unboundPair();
    assertEquals(1, runToEnd("--devices", "2", "--address", first, "--snmp-port", "28161"));
    assertTrue(out().contains("Unable to start SNMP Agent at Port : 28161 and at IpAddress : " + first), out());
    assertTrue(out().contains("Network resources cleared Successfully"));
    assertEquals("tessel: no device started", err().strip());
  }

  @Test
  void servesTheDefaultProfileUntilStopped() throws Exception {
    // One device more than a registration call takes: the network is started in two calls.
    int devices = Launcher.AGENTS_PER_CALL + 1;
    Launcher launcher = new Launcher();
    AtomicInteger status = new AtomicInteger(-1);
    Thread network = startNetwork(launcher, status, "--devices", String.valueOf(devices),
        "--address", "127.0.3.1", "--snmp-port", "28162");
    try {
      awaitStarted(network, devices);
      // What the devices answer is the integration tests' part (tests/integration).
      assertEquals(devices + 1, out().split("Snmp Agent Started").length, out());
      String last = LaunchOptions.parse(new String[] {"--address", "127.0.3.1"}, DATA, V3).address(devices - 1);
      assertTrue(out().contains("Snmp Agent Started at port : 28162 and at IPAddress : " + last + "\n"), last);
    } finally {
      launcher.requestStop();
      network.join(5000);
    }
    assertFalse(network.isAlive());
    assertEquals(0, status.get());
    assertTrue(out().endsWith("Network resources cleared Successfully\n"));
    assertEquals("", err());
  }

  @Test
  void startsOnlyTheDevicesTheDescriptorLimitLeavesRoomFor() throws Exception {
    DescriptorBudget roomForOne = new DescriptorBudget(1000, 1000, 1000 - DescriptorBudget.RESERVE - 1);
    Launcher launcher = new Launcher(() -> Optional.of(roomForOne));
    AtomicInteger status = new AtomicInteger(-1);
    Thread network = startNetwork(launcher, status, "--devices", "3", "--address", "127.0.3.5",
        "--snmp-port", "28163");
    try {
      awaitStarted(network, 1);
    } finally {
      // The stop waits for the start-up call in progress: every device it started has said so.
      launcher.requestStop();
      network.join(5000);
    }
    assertEquals(0, status.get());
    assertTrue(out().contains("Snmp Agent Started at port : 28163 and at IPAddress : 127.0.3.5"), out());
    assertEquals(2, out().split("Snmp Agent Started").length, out());
    assertEquals(roomForOne.shortfall(3), err().strip());
    assertTrue(err().startsWith("tessel: the open-file limit allows 1 agents, not 3: it is 1000"), err());
  }
}
