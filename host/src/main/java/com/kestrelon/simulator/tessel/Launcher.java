package com.kestrelon.simulator.tessel;

import com.kestrelon.simulator.tessel.LaunchOptions.UsageException;
import com.kestrelon.simulator.tessel.cli.CliHandler;
import com.kestrelon.simulator.tessel.cli.CliNetwork;
import com.kestrelon.simulator.tessel.control.AdminConfigException;
import com.kestrelon.simulator.tessel.control.AdminServer;
import com.kestrelon.simulator.tessel.control.AgentState;
import com.kestrelon.simulator.tessel.control.CliControl;
import com.kestrelon.simulator.tessel.control.DeviceTable;
import com.kestrelon.simulator.tessel.control.InformLog;
import com.kestrelon.simulator.tessel.control.NativeCliControl;
import com.kestrelon.simulator.tessel.control.NativeNotifications;
import com.kestrelon.simulator.tessel.control.NativeTl1Control;
import com.kestrelon.simulator.tessel.control.NotificationSchedule;
import com.kestrelon.simulator.tessel.control.NativeReports;
import com.kestrelon.simulator.tessel.control.Scrambling;
import com.kestrelon.simulator.tessel.control.Tl1Control;
import com.kestrelon.simulator.tessel.data.DeviceDataException;
import com.kestrelon.simulator.tessel.network.Network;
import com.kestrelon.simulator.tessel.network.Network.Admin;
import com.kestrelon.simulator.tessel.network.Network.Group;
import com.kestrelon.simulator.tessel.network.NetworkFileException;
import com.kestrelon.simulator.tessel.snmp.SnmpHandler;
import com.kestrelon.simulator.tessel.snmp.SnmpNetwork;
import com.kestrelon.simulator.tessel.snmp.SnmpV3ConfigException;
import com.kestrelon.simulator.tessel.tl1.TL1Handler;
import com.kestrelon.simulator.tessel.tl1.TL1Register;
import com.kestrelon.simulator.tessel.tl1.Tl1Network;
import java.io.IOException;
import java.io.PrintStream;
import java.net.Inet6Address;
import java.net.InetSocketAddress;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Map;
import java.util.Optional;
import java.util.function.Function;
import java.util.function.Supplier;

/**
 * {@code ./tessel run}: reads the network (a network file, or the one group the device flags
 * describe), loads every group's device data and SNMPv3 configuration, registers the objects, the
 * SNMPv3 rows, the TL1 command codes and the devices with the engine, and serves them on the
 * calling thread until
 * {@link #requestStop()} (SIGINT or SIGTERM when started from {@link #main}).
 *
 * <p>Exit statuses: 0 after a stop, 1 when the engine refuses the network or no device starts,
 * 2 for a usage error, a faulty network file, faulty data or an SNMPv3 row that is faulty or that
 * the engine refuses (the message on the error stream; a fault in a file reads
 * {@code FILE:LINE: reason}). Every file is read and checked before the engine starts. The
 * engine's status lines go to the output stream; nothing else does. A stop that comes while the
 * network is starting ends the start-up before the next step. A device that cannot open is left
 * failed and the others serve; one summary line on the error stream says how many run.
 *
 * <p>Every device holds a descriptor. When the open-file limit, as far as the engine could raise
 * it, leaves room for fewer devices than asked, one line on the error stream says how many and
 * why, and only the first that many start (the others are failed).
 */
public final class Launcher {
  /**
   * Agents registered per startSnmpNetwork call (the engine takes at most 32,767 in one). The
   * engine copies a call's arrays before it registers the agents, so small calls keep those
   * copies, and the host's own arrays, small and reused from call to call instead of leaving
   * freed memory behind in proportion to the network; a stop is also seen between calls.
   */
  static final int AGENTS_PER_CALL = 256;

  private static final String DEFAULT_NETWORK = "network.yaml";
  private static final String DEFAULT_PROFILE = "router.snmprec";
  private static final String DEFAULT_SNMPV3 = "snmpv3.conf";
  private static final String SNMP = "snmp";
  private static final String TL1 = "tl1";
  private static final String CLI = "cli";
  private static final int MAX_LOG_FILE_SIZE = 100 << 20;
  /** What {@link #start} returns when the network is up. */
  private static final int SERVING = -1;

  private final Object lifecycle = new Object();
  private boolean stopRequested; // guarded by lifecycle
  private NetworkSimulator engine; // guarded by lifecycle: set once the engine is initialised
  private AdminServer admin; // guarded by lifecycle: set once the control interface listens
  private NotificationSchedule schedule; // guarded by lifecycle: set once the devices serve
  private volatile DeviceTable devices;
  /** The informs sent through the control interface, told of their outcome by the engine. */
  private final InformLog informs = new InformLog();
  /** What the devices' PDUs have replaced, set through the control interface. */
  private volatile Scrambling scrambling;
  private final Supplier<Optional<DescriptorBudget>> descriptorBudget;
  private final Function<PrintStream, NetworkSimulator> engines;

  public Launcher() {
    this(DescriptorBudget::ofThisProcess, out -> new NetworkSimulator(out, 0));
  }

  /**
   * A launcher that asks descriptorBudget how many devices fit, once the engine is set up, and
   * drives the engine that engines gives for the status stream.
   */
  Launcher(Supplier<Optional<DescriptorBudget>> descriptorBudget,
      Function<PrintStream, NetworkSimulator> engines) {
    this.descriptorBudget = descriptorBudget;
    this.engines = engines;
  }

  public static void main(String[] args) {
    Launcher launcher = new Launcher();
    launcher.stopOnSignals();
    int status = launcher.run(args, System.out, System.err);
    if (status != 0) {
      System.exit(status);
    }
  }

  /** The network started without options. */
  static Path defaultNetwork() {
    return profile(DEFAULT_NETWORK);
  }

  /** The data file used without --snmp-data: the router profile of the profiles directory. */
  static Path defaultData() {
    return profile(DEFAULT_PROFILE);
  }

  /** The SNMPv3 configuration used without --snmpv3, from the profiles directory. */
  static Path defaultSnmpV3() {
    return profile(DEFAULT_SNMPV3);
  }

  private static Path profile(String name) {
    return Path.of(System.getProperty("tessel.profiles.dir", "profiles"), name);
  }

  /** The devices of the running network; null until it serves. */
  DeviceTable devices() {
    return devices;
  }

  /** Starts the network of the command line and serves it until a stop; returns the exit status. */
  public int run(String[] args, PrintStream out, PrintStream err) {
    LaunchOptions options;
    Network network;
    try {
      options = LaunchOptions.parse(args);
      if (options.help()) {
        out.print(LaunchOptions.usage());
        return 0;
      }
      network = options.network(defaultNetwork());
    } catch (UsageException e) {
      err.println("tessel: " + e.getMessage());
      err.println("usage: ./tessel run [options]   (--help lists them)");
      return 2;
    } catch (NetworkFileException e) {
      err.println(e.getMessage());
      return 2;
    }
    Optional<Control> control;
    try {
      control = control(network, options);
    } catch (UsageException | AdminConfigException e) {
      err.println("tessel: " + e.getMessage());
      return 2;
    }
    SnmpNetwork snmp;
    try {
      snmp = SnmpNetwork.load(network);
    } catch (DeviceDataException | SnmpV3ConfigException e) {
      err.println(e.getMessage());
      return 2;
    } catch (SnmpNetwork.FileException e) {
      err.println(e.getMessage());
      return 2;
    }
    return serve(network, snmp, control, out, err);
  }


  /** Where the control interface listens, and its token. */
  private record Control(InetSocketAddress listen, Optional<String> token) {}

  /** The control interface the network asks for, checked before anything starts; empty when off. */
  private static Optional<Control> control(Network network, LaunchOptions options)
      throws UsageException, AdminConfigException {
    if (network.admin().isEmpty()) {
      return Optional.empty();
    }
    Admin admin = network.admin().get();
    InetSocketAddress listen = new InetSocketAddress(admin.host(), admin.port());
    if (listen.isUnresolved()) {
      throw new UsageException("the control interface's address " + admin.host() + " does not resolve");
    }
    Optional<String> token = Optional.empty();
    if (options.adminTokenFile().isPresent()) {
      token = AdminServer.readToken(options.adminTokenFile().get());
    }
    AdminServer.checkListen(listen, token);
    return Optional.of(new Control(listen, token));
  }
  /**
   * Stops the network, or the start-up in progress; later calls do nothing. Any thread. The stop
   * is decided under the lifecycle lock but carried out after it: the engine's stop waits for its
   * threads, and meanwhile other callers (a second signal, say) must not wait on the lock.
   */
  public void requestStop() {
    NetworkSimulator running;
    AdminServer control;
    NotificationSchedule timers;
    synchronized (lifecycle) {
      if (stopRequested) {
        return;
      }
      stopRequested = true;
      running = engine;
      control = admin;
      timers = schedule;
    }
    if (timers != null) {
      timers.close();
    }
    // The control interface goes first: nothing may start a device while the engine stops.
    if (control != null) {
      control.close();
    }
    if (running != null) {
      running.AdapterJniStopNetwork();
    }
  }

  /** SIGINT and SIGTERM stop the network; the process then ends with status 0. */
  private void stopOnSignals() {
    sun.misc.SignalHandler handler = signal -> requestStop();
    sun.misc.Signal.handle(new sun.misc.Signal("INT"), handler);
    sun.misc.Signal.handle(new sun.misc.Signal("TERM"), handler);
  }

  private int serve(Network network, SnmpNetwork snmp, Optional<Control> control, PrintStream out,
      PrintStream err) {
    // Status lines go to the output stream only: the launcher never reads them back.
    NetworkSimulator simulator = engines.apply(out);
    Tl1Network tl1 = new Tl1Network(network, new TL1Handler(), new TL1Register());
    // A network without CLI groups never touches the engine's CLI service.
    CliNetwork cli = new CliNetwork(network, new CliHandler());
    int status = start(simulator, network, snmp, tl1, cli, err);
    if (status == SERVING && control.isPresent()) {
      status = listen(network, control.get(), tl1.isEmpty() ? Tl1Control.NONE : new NativeTl1Control(),
          cli.isEmpty() ? CliControl.NONE : new NativeCliControl(cli.handler()), err);
    }
    if (status == SERVING) {
      err.println(StartReport.summary(devices)); // last: once it shows, everything serves
      simulator.jniBaseLoop();
      return 0;
    }
    if (status != 0) {
      requestStop(); // a failed start-up stops what it set up, unless a stop came first
    }
    return status;
  }

  /**
   * Sets up the engine and starts the devices, one step at a time under the lifecycle lock so that
   * a stop is seen between steps. Returns {@link #SERVING} when the network runs, 0 when a stop
   * came first, else the exit status of the failure; it never stops the engine itself.
   */
  private int start(NetworkSimulator simulator, Network network, SnmpNetwork snmp, Tl1Network tl1, CliNetwork cli,
      PrintStream err) {
    SnmpHandler handler = snmp.handler();
    synchronized (lifecycle) {
      if (stopRequested) {
        return 0;
      }
      Path logFile = network.log().file().toAbsolutePath();
      if (!createFolderOf(logFile) || !simulator.nativeInitAgentParams(false, (byte) network.log().level(),
          logFile.toString(), 0, MAX_LOG_FILE_SIZE)) {
        err.println("tessel: the engine cannot open its log file " + logFile);
        return 2;
      }
      engine = simulator;
      handler.setInformListener(informs);
      scrambling = new Scrambling(simulator::scramblePdu);
      handler.setScrambler(scrambling);
      if (!handler.jniJVMparams()) {
        return fail(err, "the engine did not accept the host");
      }
      try {
        Optional<String> refused = snmp.register();
        if (refused.isPresent()) {
          return fail(err, refused.get());
        }
      } catch (SnmpV3ConfigException e) {
        err.println(e.getMessage());
        return 2;
      }
      if (!tl1.isEmpty()) {
        tl1.register();
      }
      if (!cli.isEmpty()) {
        Optional<String> refused = cli.register();
        if (refused.isPresent()) {
          return fail(err, refused.get());
        }
      }
    }
    DeviceTable.Builder table = new DeviceTable.Builder();
    if (!startGroups(network, snmp, tl1, cli, table, err)) {
      return 0;
    }
    synchronized (lifecycle) {
      if (stopRequested) {
        return 0;
      }
      devices = table.build(Map.of(SNMP, snmp, TL1, tl1, CLI, cli));
      if (devices.running() == 0) {
        return fail(err, "no device started");
      }
      if (!handler.initSnmpThread()) {
        return fail(err, "the engine's SNMP service did not start");
      }
      if (network.groups().stream().anyMatch(group -> !group.notifications().isEmpty())) {
        schedule = NotificationSchedule.start(network, devices, new NativeNotifications(), informs, err);
      }
    }
    return SERVING;
  }

  /**
   * Registers and opens the agents of every group's devices, in file order, as many devices as the
   * open-file limit leaves room for; the others are listed as failed. False when a stop came first.
   */
  private boolean startGroups(Network network, SnmpNetwork snmp, Tl1Network tl1, CliNetwork cli,
      DeviceTable.Builder table, PrintStream err) {
    long descriptorsLeft = descriptorsThatFit(network, err);
    StartReport report = new StartReport(err, Boolean.getBoolean("tessel.progress"), network.devices());
    long done = 0;
    int snmpGroup = -1;
    try {
      for (Group group : network.groups()) {
        snmpGroup += group.snmp().isPresent() ? 1 : 0;
        int perDevice = descriptorsPerDevice(group);
        for (int first = 0; first < group.count(); first += AGENTS_PER_CALL) {
          int count = Math.min(AGENTS_PER_CALL, group.count() - first);
          int starting = (int) Math.min(count, descriptorsLeft / perDevice);
          // The first devices that fit start, and none after them.
          descriptorsLeft = starting < count ? 0 : descriptorsLeft - (long) starting * perDevice;
          List<Map<String, AgentState>> states;
          synchronized (lifecycle) {
            if (stopRequested) {
              return false;
            }
            states = startAgents(group, snmpGroup, first, count, starting, snmp, tl1, cli);
          }
          for (int i = 0; i < count; i++) {
            table.add(group.firstAddress() + first + i, network.firstAgentId(group) + first + i,
                group.deviceName(first + i), group.name(), states.get(i));
          }
          done += count;
          report.progress(done);
        }
      }
      return true;
    } finally {
      report.done();
    }
  }

  /**
   * Opens every protocol's agents of devices [first, first + starting) of a group; devices up to
   * first + count that did not fit are failed. The state of each device's agents, by protocol.
   */
  private static List<Map<String, AgentState>> startAgents(Group group, int snmpGroup, int first, int count,
      int starting, SnmpNetwork snmp, Tl1Network tl1, CliNetwork cli) {
    boolean[] snmpOpened = group.snmp().isPresent() && starting > 0 ? snmp.startAgents(snmpGroup, first, starting)
        : new boolean[0];
    List<Optional<String>> tl1Opened = group.tl1().isPresent() && starting > 0
        ? tl1.startAgents(group, first, starting) : List.of();
    List<Optional<String>> cliOpened = group.cli().isPresent() && starting > 0
        ? cli.startAgents(group, first, starting) : List.of();
    List<Map<String, AgentState>> states = new ArrayList<>(count);
    for (int i = 0; i < count; i++) {
      Map<String, AgentState> device = new LinkedHashMap<>();
      if (group.snmp().isPresent()) {
        device.put(SNMP, i < snmpOpened.length && snmpOpened[i] ? AgentState.RUNNING : AgentState.FAILED);
      }
      if (group.tl1().isPresent()) {
        device.put(TL1, i < tl1Opened.size() && tl1Opened.get(i).isEmpty() ? AgentState.RUNNING : AgentState.FAILED);
      }
      if (group.cli().isPresent()) {
        device.put(CLI, i < cliOpened.size() && cliOpened.get(i).isEmpty() ? AgentState.RUNNING : AgentState.FAILED);
      }
      states.add(device);
    }
    return states;
  }

  /**
   * The sockets one device of the group holds: its SNMP agent, its TL1 listener and Telnet
   * listener, its CLI Telnet and SSH listeners.
   */
  private static int descriptorsPerDevice(Group group) {
    return (group.snmp().isPresent() ? 1 : 0) + group.tl1().map(tl1 -> tl1.telnetPort().isPresent() ? 2 : 1).orElse(0)
        + group.cli().map(Network.Cli::sockets).orElse(0);
  }

  /** Opens the control interface on the running network; returns SERVING or the exit status. */
  private int listen(Network network, Control control, Tl1Control tl1, CliControl cli, PrintStream err) {
    synchronized (lifecycle) {
      if (stopRequested) {
        return 0;
      }
      try {
        admin = AdminServer.start(control.listen(), control.token(), network, devices, new NativeReports(),
            new AdminServer.Notifications(new NativeNotifications(), informs), scrambling, tl1, cli);
      } catch (IOException e) {
        return fail(err, "the control interface cannot listen on " + control.listen() + ": " + e.getMessage());
      }
      InetSocketAddress address = admin.address();
      String host = address.getAddress().getHostAddress();
      host = address.getAddress() instanceof Inet6Address ? "[" + host + "]" : host;
      err.println("control interface: http://" + host + ":" + address.getPort() + "/");
      return SERVING;
    }
  }

  private static boolean createFolderOf(Path file) {
    try {
      Files.createDirectories(file.getParent());
      return true;
    } catch (IOException e) {
      return false;
    }
  }

  /**
   * The sockets the devices may open: all they need, or as many as the descriptor limit leaves
   * room for (then one line says how many devices start).
   */
  private long descriptorsThatFit(Network network, PrintStream err) {
    long needed = 0;
    for (Group group : network.groups()) {
      needed += (long) group.count() * descriptorsPerDevice(group);
    }
    Optional<DescriptorBudget> budget = descriptorBudget.get();
    if (budget.isEmpty() || budget.get().allowedAgents() >= needed) {
      return needed;
    }
    long allowed = budget.get().allowedAgents();
    long devicesStarting = 0;
    for (Group group : network.groups()) {
      long fit = Math.min(group.count(), allowed / descriptorsPerDevice(group));
      devicesStarting += fit;
      allowed -= fit * descriptorsPerDevice(group);
      if (fit < group.count()) {
        break;
      }
    }
    err.println(budget.get().shortfall((int) Math.min(Integer.MAX_VALUE, needed), devicesStarting));
    return budget.get().allowedAgents();
  }

  /** Reports a failed start-up; returns its exit status. */
  private static int fail(PrintStream err, String reason) {
    err.println("tessel: " + reason);
    return 1;
  }
}
