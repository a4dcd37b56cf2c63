package com.kestrelon.simulator.tessel;

import com.kestrelon.simulator.tessel.data.DeviceDataException;
import com.kestrelon.simulator.tessel.data.ValueText;
import com.kestrelon.simulator.tessel.network.Network;
import com.kestrelon.simulator.tessel.cli.CliData;
import com.kestrelon.simulator.tessel.network.Network.Admin;
import com.kestrelon.simulator.tessel.network.Network.Cli;
import com.kestrelon.simulator.tessel.network.Network.Group;
import com.kestrelon.simulator.tessel.network.Network.Log;
import com.kestrelon.simulator.tessel.network.Network.Snmp;
import com.kestrelon.simulator.tessel.network.Network.Tl1;
import com.kestrelon.simulator.tessel.network.NetworkFile;
import com.kestrelon.simulator.tessel.network.NetworkFileException;
import com.kestrelon.simulator.tessel.tl1.TL1Data;
import java.nio.ByteBuffer;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.List;
import java.util.Optional;
import java.util.OptionalInt;
import picocli.CommandLine;
import picocli.CommandLine.Command;
import picocli.CommandLine.Option;
import picocli.CommandLine.ParameterException;

/**
 * The options of {@code ./tessel run}: a network file, or the flags of a one-group network, plus
 * what overrides either (log, control interface, state folder). Each option takes its value as the
 * next argument or after '=' ({@code --devices 10}, {@code --devices=10}).
 */
@Command(name = "./tessel run", sortOptions = false, usageHelpWidth = 100,
    description = {"Starts a simulated network and serves it until Ctrl-C or SIGTERM: the network file given,",
        "a one-group network the device flags describe, or without either profiles/network.yaml."})
public final class LaunchOptions {
  private static final long LAST_ADDRESS = 0xFFFF_FFFFL;
  /** The names of the devices of the flags when they answer TL1. */
  static final String TL1_DEVICE_NAME = "NE{n}";
  /** The names of the devices of the flags when they answer the CLI and not TL1: their hostnames. */
  static final String CLI_DEVICE_NAME = "R{n}";

  @Option(names = "--network", paramLabel = "FILE", description = "the network file (YAML) to start")
  Path networkFile;

  @Option(names = "--snmp-data", paramLabel = "FILE",
      description = "device data: a .snmprec file or snmpwalk -On output (default: profiles/router.snmprec)")
  Path dataFile;

  @Option(names = "--snmpv3", paramLabel = "FILE",
      description = "SNMPv3 users, contexts, groups, access rows and views (default: profiles/snmpv3.conf)")
  Path snmpV3File;

  @Option(names = "--devices", paramLabel = "N", description = "number of devices (default 100)")
  Integer devices;

  @Option(names = "--address", paramLabel = "A",
      description = "IPv4 address of device 0; device i is at A + i (default 127.0.1.1)")
  String address;

  @Option(names = "--snmp-port", paramLabel = "P", description = "UDP port of every device (default 1161)")
  Integer port;

  @Option(names = "--read-community", paramLabel = "C", description = "community for reads (default public)")
  String readCommunity;

  @Option(names = "--write-community", paramLabel = "C",
      description = "community for writes, also accepted for reads (default private)")
  String writeCommunity;

  @Option(names = "--tl1-data", paramLabel = "FILE",
      description = "TL1 data file: the devices also answer TL1 (without SNMP unless an SNMP option is given)")
  Path tl1DataFile;

  @Option(names = "--tl1-port", paramLabel = "P",
      description = "TCP port of every device's TL1 sessions (default 3083)")
  Integer tl1Port;

  @Option(names = "--tl1-keepalive", paramLabel = "S",
      description = "seconds a silent TL1 session stays open; 0 for ever (default 0)")
  Integer tl1KeepAlive;

  @Option(names = "--cli-data", paramLabel = "FILE",
      description = "CLI data file: the devices also answer a router CLI over Telnet (without SNMP unless an SNMP "
          + "option is given)")
  Path cliDataFile;

  @Option(names = "--cli-port", paramLabel = "P", description = "TCP port of every device's Telnet CLI (default 2323)")
  Integer cliPort;

  @Option(names = "--ssh-port", paramLabel = "P", description = "TCP port of every device's SSH CLI (default none)")
  Integer sshPort;

  @Option(names = "--cli-user", paramLabel = "U", description = "the CLI login user (default admin)")
  String cliUser;

  @Option(names = "--cli-password", paramLabel = "W", description = "the CLI login password (default admin)")
  String cliPassword;

  @Option(names = "--cli-enable", paramLabel = "E",
      description = "the enable secret; empty for none (default enable)")
  String cliEnable;

  @Option(names = "--log-level", paramLabel = "0..3", description = "detail of the engine's log; 0 writes none")
  Integer logLevel;

  @Option(names = "--log-file", paramLabel = "F", description = "the engine's log file (default tessel.log)")
  Path logFile;

  @Option(names = "--admin", paramLabel = "HOST:PORT|off",
      description = "where the control interface listens (default 127.0.0.1:8161)")
  String admin;

  @Option(names = "--admin-token-file", paramLabel = "F",
      description = "the control interface's secret; needed to listen on an address outside loopback")
  Path adminTokenFile;

  @Option(names = "--state-dir", paramLabel = "DIR",
      description = "where a run keeps what the next needs (default ~/.local/state/tessel)")
  Path stateDir;

  @Option(names = {"-h", "--help"}, usageHelp = true, description = "print this text")
  boolean help;

  /** A command line that does not ask for a network this launcher can start. */
  public static final class UsageException extends Exception {
    private static final long serialVersionUID = 1L;

    UsageException(String message) {
      super(message);
    }
  }

  /** Reads the command line. */
  public static LaunchOptions parse(String[] args) throws UsageException {
    LaunchOptions options = new LaunchOptions();
    try {
      new CommandLine(options).parseArgs(args);
    } catch (ParameterException e) {
      throw new UsageException(e.getMessage());
    }
    return options;
  }

  /** The usage text. */
  public static String usage() {
    return new CommandLine(new LaunchOptions()).getUsageMessage();
  }

  public boolean help() {
    return help;
  }

  public Optional<Path> adminTokenFile() {
    return Optional.ofNullable(adminTokenFile);
  }

  /**
   * The network to start: the network file (or {@code defaultNetwork} when no device flag is
   * given), or the one group the device flags describe; the log, control and state options
   * override either.
   */
  public Network network(Path defaultNetwork) throws UsageException, NetworkFileException {
    Object[][] paths = {{"--network", networkFile}, {"--snmp-data", dataFile}, {"--snmpv3", snmpV3File},
        {"--tl1-data", tl1DataFile}, {"--cli-data", cliDataFile}, {"--log-file", logFile}, {"--admin-token-file", adminTokenFile},
        {"--state-dir", stateDir}};
    for (Object[] path : paths) {
      if (path[1] != null && path[1].toString().isEmpty()) {
        throw new UsageException(path[0] + " needs a value");
      }
    }
    List<String> groupFlags = groupFlags();
    if (networkFile != null && !groupFlags.isEmpty()) {
      throw new UsageException("--network cannot be mixed with " + String.join(", ", groupFlags)
          + ": describe the devices in the network file");
    }
    Network network = groupFlags.isEmpty()
        ? NetworkFile.read(networkFile != null ? networkFile : defaultNetwork)
        : flagNetwork();
    return overridden(network);
  }

  private List<String> groupFlags() {
    List<String> given = snmpFlags();
    given.addAll(given(new Object[][] {{"--devices", devices}, {"--address", address}, {"--tl1-data", tl1DataFile},
        {"--tl1-port", tl1Port}, {"--tl1-keepalive", tl1KeepAlive}}));
    given.addAll(cliFlags());
    return given;
  }

  private List<String> cliFlags() {
    return given(new Object[][] {{"--cli-data", cliDataFile}, {"--cli-port", cliPort}, {"--ssh-port", sshPort},
        {"--cli-user", cliUser}, {"--cli-password", cliPassword}, {"--cli-enable", cliEnable}});
  }

  private List<String> snmpFlags() {
    return given(new Object[][] {{"--snmp-data", dataFile}, {"--snmpv3", snmpV3File}, {"--snmp-port", port},
        {"--read-community", readCommunity}, {"--write-community", writeCommunity}});
  }

  /** The names of the flags given, of {name, value} pairs. */
  private static List<String> given(Object[][] flags) {
    List<String> given = new ArrayList<>();
    for (Object[] flag : flags) {
      if (flag[1] != null) {
        given.add((String) flag[0]);
      }
    }
    return given;
  }

  /**
   * The one-group network of the device flags, named after its SNMP data file, or its TL1 or CLI
   * data file when it serves no SNMP.
   */
  private Network flagNetwork() throws UsageException, NetworkFileException {
    int count = devices == null ? 100 : number("--devices", devices, 1, Integer.MAX_VALUE);
    long first = address == null ? 0x7F00_0101L : parseAddress(address);
    if (first + count - 1 > LAST_ADDRESS) {
      throw new UsageException(count + " devices from " + Network.dotted(first) + " run past 255.255.255.255");
    }
    Optional<Tl1> tl1 = tl1();
    Optional<Cli> cli = cli(tl1);
    Optional<Snmp> snmp = (tl1.isEmpty() && cli.isEmpty()) || !snmpFlags().isEmpty() ? Optional.of(snmp())
        : Optional.empty();
    Path named = snmp.isPresent() ? snmp.get().data() : tl1.isPresent() ? tl1DataFile : cliDataFile;
    String name = named.getFileName().toString().replaceFirst("\\.[^.]*$", "");
    // A TL1 device answers with its name as SID, which a TID must match: NE1, NE2, ... rather than
    // an address, whose dots no TID may hold; a CLI device's name is its hostname, R1, R2, ...
    String deviceName = tl1.isPresent() ? TL1_DEVICE_NAME : cli.isPresent() ? CLI_DEVICE_NAME : "{address}";
    Group group = new Group(name.isEmpty() ? "devices" : name, count, first, deviceName, snmp, List.of(),
        List.of(), tl1, cli);
    return new Network(new Log(0, Path.of("tessel.log")), Optional.of(new Admin("127.0.0.1", 8161)),
        Path.of(System.getProperty("user.home"), ".local", "state", "tessel"), List.of(group));
  }

  private Snmp snmp() throws UsageException {
    return new Snmp(port == null ? 1161 : number("--snmp-port", port, 1, 65534),
        dataFile != null ? dataFile : Launcher.defaultData(),
        Optional.of(snmpV3File != null ? snmpV3File : Launcher.defaultSnmpV3()),
        community("--read-community", readCommunity, "public"),
        community("--write-community", writeCommunity, "private"));
  }

  /** The TL1 agents of the flags: none without --tl1-data, which the other TL1 flags need. */
  private Optional<Tl1> tl1() throws UsageException, NetworkFileException {
    if (tl1DataFile == null) {
      String orphan = tl1Port != null ? "--tl1-port" : tl1KeepAlive != null ? "--tl1-keepalive" : null;
      if (orphan != null) {
        throw new UsageException(orphan + " needs --tl1-data");
      }
      return Optional.empty();
    }
    int tl1PortNumber = tl1Port == null ? Tl1.DEFAULT_PORT : number("--tl1-port", tl1Port, 1, 65535);
    int keepAlive = tl1KeepAlive == null ? 0 : number("--tl1-keepalive", tl1KeepAlive, 0, Integer.MAX_VALUE);
    try {
      return Optional.of(new Tl1(tl1PortNumber, OptionalInt.empty(), keepAlive, tl1DataFile,
          TL1Data.load(tl1DataFile), List.of(), false, "--tl1-data"));
    } catch (DeviceDataException e) {
      throw new NetworkFileException(e.file(), e.line(), e.reason());
    }
  }

  /** The CLI agents of the flags: none without --cli-data, which the other CLI flags need. */
  private Optional<Cli> cli(Optional<Tl1> tl1) throws UsageException, NetworkFileException {
    if (cliDataFile == null) {
      List<String> orphans = cliFlags();
      if (!orphans.isEmpty()) {
        throw new UsageException(orphans.get(0) + " needs --cli-data");
      }
      return Optional.empty();
    }
    int telnet = cliPort == null ? Cli.DEFAULT_PORT : number("--cli-port", cliPort, 1, 65535);
    OptionalInt ssh = sshPort == null ? OptionalInt.empty() : OptionalInt.of(number("--ssh-port", sshPort, 1, 65535));
    int tl1Listener = tl1.map(Tl1::port).orElse(-1);
    if ((ssh.isPresent() && ssh.getAsInt() == telnet) || telnet == tl1Listener
        || (ssh.isPresent() && ssh.getAsInt() == tl1Listener)) {
      throw new UsageException("--cli-port, --ssh-port and --tl1-port need different ports");
    }
    for (String[] text : new String[][] {{"--cli-user", cliUser}, {"--cli-password", cliPassword}}) {
      if (text[1] != null && text[1].isEmpty()) {
        throw new UsageException(text[0] + " needs a value");
      }
    }
    try {
      return Optional.of(new Cli(telnet, ssh, cliDataFile, CliData.load(cliDataFile),
          cliUser == null ? Cli.DEFAULT_USER : cliUser, cliPassword == null ? Cli.DEFAULT_PASSWORD : cliPassword,
          cliEnable == null ? Cli.DEFAULT_ENABLE : cliEnable, "--cli-data"));
    } catch (DeviceDataException e) {
      throw new NetworkFileException(e.file(), e.line(), e.reason());
    }
  }

  private Network overridden(Network network) throws UsageException {
    Log log = new Log(logLevel == null ? network.log().level() : number("--log-level", logLevel, 0, 3),
        logFile == null ? network.log().file() : logFile);
    Optional<Admin> listen = network.admin();
    if (admin != null) {
      listen = Admin.parse(admin);
      if (listen == null) {
        throw new UsageException("--admin takes " + Admin.expected() + ", not '" + admin + "'");
      }
    }
    return new Network(log, listen, stateDir == null ? network.stateDir() : stateDir, network.groups(),
        network.trapSinks());
  }

  private static int number(String name, int value, int low, int high) throws UsageException {
    if (value < low || value > high) {
      throw new UsageException(name + " takes a number from " + low + " to " + high + ", not '" + value + "'");
    }
    return value;
  }

  /** The engine reads a community list split at ',', so one community cannot hold one. */
  private static String community(String name, String value, String otherwise) throws UsageException {
    if (value == null) {
      return otherwise;
    }
    if (value.isEmpty() || value.indexOf(',') >= 0) {
      throw new UsageException(name + " takes a non-empty community without ',', not '" + value + "'");
    }
    return value;
  }

  private static long parseAddress(String text) throws UsageException {
    try {
      return Integer.toUnsignedLong(ByteBuffer.wrap(ValueText.parseIpAddress(text)).getInt());
    } catch (IllegalArgumentException e) {
      throw new UsageException("--address takes an IPv4 address such as 127.0.1.1, not '" + text + "'");
    }
  }
}
