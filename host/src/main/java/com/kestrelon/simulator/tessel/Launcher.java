package com.kestrelon.simulator.tessel;

import com.kestrelon.simulator.tessel.LaunchOptions.UsageException;
import com.kestrelon.simulator.tessel.data.CellDefinition;
import com.kestrelon.simulator.tessel.data.DeviceData;
import com.kestrelon.simulator.tessel.data.DeviceDataException;
import com.kestrelon.simulator.tessel.data.MibLayout;
import com.kestrelon.simulator.tessel.snmp.DeviceStore;
import com.kestrelon.simulator.tessel.snmp.SerToCConverter;
import com.kestrelon.simulator.tessel.snmp.SnmpHandler;
import com.kestrelon.simulator.tessel.snmp.SnmpRegister;
import com.kestrelon.simulator.tessel.snmp.SnmpV3Config;
import com.kestrelon.simulator.tessel.snmp.SnmpV3ConfigException;
import java.io.IOException;
import java.io.PrintStream;
import java.nio.file.NoSuchFileException;
import java.nio.file.Path;
import java.util.Arrays;
import java.util.List;
import java.util.Optional;
import java.util.function.Function;
import java.util.function.Supplier;

/**
 * {@code ./tessel run}: loads the device data and the SNMPv3 configuration, registers the
 * objects, the SNMPv3 rows and the devices with the engine, and serves them on the calling thread until {@link #requestStop()} (SIGINT or SIGTERM
 * when started from {@link #main}).
 *
 * <p>Exit statuses: 0 after a stop, 1 when the engine refuses the network or no device starts,
 * 2 for a usage error, faulty data or an SNMPv3 row that is faulty or that the engine refuses
 * (the message on the error stream; a fault in a file reads {@code FILE:LINE: reason}). Both
 * files are read and checked before the engine starts. The engine's status lines go to the output stream; nothing else
 * does. A stop that comes while the network is starting ends the start-up before the next step.
 *
 * <p>Every device holds a descriptor. When the open-file limit, as far as the engine could raise
 * it, leaves room for fewer devices than asked, one line on the error stream says how many and
 * why, and only the first that many start.
 */
public final class Launcher {
  /**
   * Agents registered per startSnmpNetwork call (the engine takes at most 32,767 in one). The
   * engine copies a call's arrays before it registers the agents, so small calls keep those
   * copies, and the host's own arrays, small and reused from call to call instead of leaving
   * freed memory behind in proportion to the network; a stop is also seen between calls.
   */
  static final int AGENTS_PER_CALL = 256;

  private static final String DEFAULT_PROFILE = "router.snmprec";
  private static final String DEFAULT_SNMPV3 = "snmpv3.conf";
  private static final int MAX_LOG_FILE_SIZE = 100 << 20;
  private static final int ENGINE_BOOTS = 1;
  /** What {@link #start} returns when the network is up. */
  private static final int SERVING = -1;

  private final Object lifecycle = new Object();
  private boolean stopRequested; // guarded by lifecycle
  private NetworkSimulator engine; // guarded by lifecycle: set once the engine is initialised
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

  /** Starts the network of the command line and serves it until a stop; returns the exit status. */
  public int run(String[] args, PrintStream out, PrintStream err) {
    LaunchOptions options;
    try {
      options = LaunchOptions.parse(args, defaultData(), defaultSnmpV3());
    } catch (UsageException e) {
      err.println("tessel: " + e.getMessage());
      err.println("usage: ./tessel run [options]   (--help lists them)");
      return 2;
    }
    if (options.help()) {
      out.print(LaunchOptions.USAGE);
      return 0;
    }
    DeviceData data;
    List<CellDefinition> cells;
    SnmpV3Config snmpV3;
    Path reading = options.dataFile();
    try {
      data = DeviceData.load(reading);
      cells = MibLayout.infer(data);
      reading = options.snmpV3File();
      snmpV3 = SnmpV3Config.load(reading);
    } catch (DeviceDataException | SnmpV3ConfigException e) {
      err.println(e.getMessage());
      return 2;
    } catch (NoSuchFileException e) {
      err.println(reading + ": no such file");
      return 2;
    } catch (IOException e) {
      err.println(reading + ": cannot be read: " + e.getMessage());
      return 2;
    }
    return serve(options, data, cells, snmpV3, out, err);
  }

  /**
   * Stops the network, or the start-up in progress; later calls do nothing. Any thread. The stop
   * is decided under the lifecycle lock but carried out after it: the engine's stop waits for its
   * threads, and meanwhile other callers (a second signal, say) must not wait on the lock.
   */
  public void requestStop() {
    NetworkSimulator running;
    synchronized (lifecycle) {
      if (stopRequested) {
        return;
      }
      stopRequested = true;
      running = engine;
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

  private int serve(LaunchOptions options, DeviceData data, List<CellDefinition> cells,
      SnmpV3Config snmpV3, PrintStream out, PrintStream err) {
    // Status lines go to the output stream only: the launcher never reads them back.
    NetworkSimulator simulator = engines.apply(out);
    int status = start(simulator, options, data, cells, snmpV3, err);
    if (status == SERVING) {
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
  private int start(NetworkSimulator simulator, LaunchOptions options, DeviceData data,
      List<CellDefinition> cells, SnmpV3Config snmpV3, PrintStream err) {
    SnmpHandler handler = new SnmpHandler(new DeviceStore(data));
    synchronized (lifecycle) {
      if (stopRequested) {
        return 0;
      }
      String logFile = Path.of(options.logFile()).toAbsolutePath().toString();
      if (!simulator.nativeInitAgentParams(false, (byte) options.logLevel(), logFile, 0,
          MAX_LOG_FILE_SIZE)) {
        err.println("tessel: the engine cannot open its log file " + logFile);
        return 2;
      }
      engine = simulator;
      if (!handler.jniJVMparams()) {
        return fail(err, "the engine did not accept the host");
      }
      // The rows go under the engine ID that jniJVMparams set.
      try {
        snmpV3.apply(new SerToCConverter());
      } catch (SnmpV3ConfigException e) {
        err.println(e.getMessage());
        return 2;
      }
      String refused = registerCells(cells);
      if (refused != null) {
        return fail(err, "the engine refused the objects registered at " + refused);
      }
    }
    int devices = devicesThatFit(options.devices(), err);
    int started = 0;
    String databaseName = String.valueOf(options.dataFile().getFileName());
    for (int first = 0; first < devices; first += AGENTS_PER_CALL) {
      synchronized (lifecycle) {
        if (stopRequested) {
          return 0;
        }
        started += startAgents(handler, options, databaseName, first,
            Math.min(AGENTS_PER_CALL, devices - first));
      }
    }
    synchronized (lifecycle) {
      if (stopRequested) {
        return 0;
      }
      if (started == 0) {
        return fail(err, "no device started");
      }
      if (!handler.initSnmpThread()) {
        return fail(err, "the engine's SNMP service did not start");
      }
    }
    return SERVING;
  }

  /** The devices to start: all asked for, or as many as the descriptor limit leaves room for. */
  private int devicesThatFit(int requested, PrintStream err) {
    Optional<DescriptorBudget> budget = descriptorBudget.get();
    if (budget.isEmpty() || budget.get().allowedAgents() >= requested) {
      return requested;
    }
    err.println(budget.get().shortfall(requested));
    return budget.get().allowedAgents();
  }

  /** Reports a failed start-up; returns its exit status. */
  private static int fail(PrintStream err, String reason) {
    err.println("tessel: " + reason);
    return 1;
  }

  /** Registers every cell; returns the OID of the first the engine refuses, or null. */
  private static String registerCells(List<CellDefinition> cells) {
    SnmpRegister register = new SnmpRegister();
    for (CellDefinition cell : cells) {
      int count = cell.subIds().size();
      if (!register.JniCreateTreeCell(cell.label(), null, "V2", "." + cell.oid(), count,
          cell.subIds().toArray(String[]::new), cell.dataTypes().toArray(String[]::new),
          cell.accessTexts().toArray(String[]::new), cell.isTable(), cell.rowStatusColumn(),
          null)) {
        return cell.oid();
      }
    }
    return null;
  }

  /** Registers and opens devices [first, first + count); returns how many opened. */
  private static int startAgents(SnmpHandler handler, LaunchOptions options, String databaseName,
      int first, int count) {
    int[] agentIds = new int[count];
    String[] tableNames = new String[count];
    String[] addresses = new String[count];
    for (int i = 0; i < count; i++) {
      agentIds[i] = first + i;
      tableNames[i] = "device" + (first + i);
      addresses[i] = options.address(first + i);
    }
    int[] ports = filled(count, options.port());
    // The engine splits a community text at ',': the write community also reads.
    String[] reads = filled(count, options.readCommunity() + "," + options.writeCommunity());
    String[] writes = filled(count, options.writeCommunity());
    int[] sockets = handler.startSnmpNetwork(agentIds, tableNames, addresses, ports, reads, writes,
        filled(count, ENGINE_BOOTS), databaseName, new int[count]);
    return sockets == null ? 0 : (int) Arrays.stream(sockets).filter(socket -> socket > 0).count();
  }

  private static int[] filled(int count, int value) {
    int[] array = new int[count];
    Arrays.fill(array, value);
    return array;
  }

  private static String[] filled(int count, String value) {
    String[] array = new String[count];
    Arrays.fill(array, value);
    return array;
  }
}
