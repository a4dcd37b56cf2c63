package com.kestrelon.simulator.tessel;

import static java.nio.charset.StandardCharsets.UTF_8;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertTrue;
import static org.junit.jupiter.api.Assertions.fail;

import java.io.ByteArrayOutputStream;
import java.io.IOException;
import java.io.PrintStream;
import java.net.DatagramSocket;
import java.net.InetSocketAddress;
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
  private static final Path DATA = Path.of("d.snmprec");
  private static final Path V3 = Path.of("v3.conf");

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

  /** Waits, 10 s at most, until devices have said they started or the launch has ended. */
  private void awaitStarted(Thread network, int devices) throws InterruptedException {
    long deadline = System.nanoTime() + 10_000_000_000L;
    while (started() < devices && System.nanoTime() < deadline && network.isAlive()) {
      Thread.sleep(20);
    }
  }

  private int started() {
    return out().split("Snmp Agent Started").length - 1;
  }

  private String out() {
    return out.toString(UTF_8);
  }

  private String err() {
    return err.toString(UTF_8);
  }

  private static boolean bindable(String address) {
    try (DatagramSocket socket = new DatagramSocket(new InetSocketAddress(address, 0))) {
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

  @Test
  void optionsTakeTheirValuesInEitherFormAndDefaultsOtherwise() throws Exception {
    assertEquals(new LaunchOptions(DATA, V3, 100, 0x7F000101L, 1161, "public", "private", 0,
        "tessel.log", false), LaunchOptions.parse(new String[0], DATA, V3));
    LaunchOptions set = LaunchOptions.parse(new String[] {"--snmp-data", "x.walk",
        "--snmpv3=u.conf", "--devices=3", "--address", "10.0.0.254", "--snmp-port=11161",
        "--read-community", "r", "--write-community=w", "--log-level", "3", "--log-file", "e.log"},
        DATA, V3);
    assertEquals(new LaunchOptions(Path.of("x.walk"), Path.of("u.conf"), 3, 0x0A0000FEL, 11161,
        "r", "w", 3, "e.log", false), set);
    assertEquals(List.of("10.0.0.254", "10.0.0.255", "10.0.1.0"),
        List.of(set.address(0), set.address(1), set.address(2)), "addresses carry into the next octet");
    assertEquals("255.255.255.255",
        LaunchOptions.parse(new String[] {"--address", "255.255.255.254", "--devices", "2"}, DATA, V3).address(1));
  }

  @ParameterizedTest
  @CsvSource(delimiter = ';', value = {
      "--bogus;                    unknown option '--bogus'",
      "--devices;                  --devices needs a value",
      "--snmp-data=;               --snmp-data needs a value",
      "--devices 0;                --devices takes a number from 1",
      "--snmp-port 65536;          --snmp-port takes a number from 1 to 65535",
      "--address 127.0.1.256;      --address takes an IPv4 address such as 127.0.1.1, not '127.0.1.256'",
      "--read-community a,b;       --read-community takes a non-empty community without ','",
      "--address 255.255.255.254 --devices 3; 3 devices from 255.255.255.254 run past 255.255.255.255"})
  void usageErrorsExitWithStatusTwo(String args, String message) throws Exception {
    assertEquals(2, runToEnd(args.split(" ")));
    assertTrue(err().startsWith("tessel: " + message), err());
    assertEquals("", out());
  }

  @Test
  void helpGoesToStandardOutput() throws Exception {
    assertEquals(0, runToEnd("--devices", "5", "--help"));
    assertEquals(LaunchOptions.USAGE, out());
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
    assertEquals("", out());
  }

  @Test
  void noDeviceStartedExitsWithStatusOne() throws Exception {
    String nowhere = "203.0.113.1"; // a documentation address, on no interface of a test machine
    assertFalse(bindable(nowhere), "this machine has " + nowhere);
    assertEquals(1, runToEnd("--address", nowhere, "--devices", "1", "--snmp-port", "28161"));
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
        "--address", "127.0.3.1", "--snmp-port", "28162");
    try {
      // What the devices answer is the integration tests' part (tests/integration).
      awaitStarted(network, fit);
    } finally {
      launcher.get().requestStop();
      network.join(5000);
    }
    assertFalse(network.isAlive());
    assertEquals(0, status.get());
    assertEquals(fit, started(), out());
    assertTrue(out().contains("Snmp Agent Started at port : 28162 and at IPAddress : 127.0.4.1\n"));
    assertTrue(out().endsWith("Network resources cleared Successfully\n"));
    assertEquals(budget.shortfall(fit + 2), err().strip());
    assertTrue(err().startsWith("tessel: the open-file limit allows " + fit + " agents, not " + (fit + 2)), err());
    assertTrue(secondRequestReturned.get(), "a second stop request waited for the first");
    launcher.get().requestStop();
    assertEquals(1, stops.get(), "the engine is stopped once");
  }
}
