package com.kestrelon.simulator.tessel;

import com.kestrelon.simulator.tessel.data.ValueText;
import java.nio.ByteBuffer;
import java.nio.file.Path;

/**
 * The options of {@code ./tessel run}: what network to start. Each option takes its value as the
 * next argument or after '=' ({@code --devices 10}, {@code --devices=10}). Immutable.
 *
 * @param dataFile the device data every device starts from
 * @param snmpV3File the SNMPv3 configuration: users, contexts, groups, access rows and views
 * @param devices how many devices; device i is at {@code firstAddress + i}
 * @param firstAddress the IPv4 address of device 0 as an unsigned 32-bit number
 * @param port the UDP port of every device
 * @param logLevel the engine's log level, 0 (no log) to 3 (every operation)
 * @param help true when only the usage text is asked for
 */
public record LaunchOptions(Path dataFile, Path snmpV3File, int devices, long firstAddress, int port,
    String readCommunity, String writeCommunity, int logLevel, String logFile, boolean help) {

  public static final String USAGE = """
      usage: ./tessel run [options]
      Starts a network of simulated SNMP devices and serves it until Ctrl-C or SIGTERM.

        --snmp-data FILE      device data: a .snmprec file or snmpwalk -On output
                              (default: the router profile in profiles/)
        --snmpv3 FILE         SNMPv3 users, contexts, groups, access rows and views
                              (default: profiles/snmpv3.conf)
        --devices N           number of devices (default 100)
        --address A           IPv4 address of device 0; device i is at A + i (default 127.0.1.1)
        --snmp-port P         UDP port of every device (default 1161)
        --read-community C    community for reads (default public)
        --write-community C   community for writes, also accepted for reads (default private)
        --log-level 0..3      detail of the engine's log; 0 writes none (default 0)
        --log-file F          the engine's log file (default tessel.log)
        --help                print this text
      """;

  private static final long LAST_ADDRESS = 0xFFFF_FFFFL;

  /** A command line that does not ask for a network this launcher can start. */
  public static final class UsageException extends Exception {
    private static final long serialVersionUID = 1L;

    UsageException(String message) {
      super(message);
    }
  }

  /**
   * Reads the command line; unset options take their defaults, the data file {@code defaultData}
   * and the SNMPv3 configuration {@code defaultSnmpV3}.
   */
  public static LaunchOptions parse(String[] args, Path defaultData, Path defaultSnmpV3)
      throws UsageException {
    Builder options = new Builder(defaultData, defaultSnmpV3);
    for (int i = 0; i < args.length; i++) {
      String name = args[i];
      String value = null;
      int equals = name.indexOf('=');
      if (name.startsWith("--") && equals > 0) {
        value = name.substring(equals + 1);
        name = name.substring(0, equals);
      }
      if (name.equals("--help") || name.equals("-h")) {
        options.help = true;
        continue;
      }
      if (value == null) {
        if (i + 1 == args.length) {
          throw new UsageException(knownOption(name) + " needs a value");
        }
        value = args[++i];
      }
      options.set(name, value);
    }
    return options.build();
  }

  private static String knownOption(String name) throws UsageException {
    return switch (name) {
      case "--snmp-data", "--snmpv3", "--devices", "--address", "--snmp-port", "--read-community",
          "--write-community", "--log-level", "--log-file" -> name;
      default -> throw new UsageException("unknown option '" + name + "'");
    };
  }

  /** The dotted text of the address of device {@code index}. */
  public String address(int index) {
    return dotted(firstAddress + index);
  }

  private static String dotted(long address) {
    return ValueText.ipText(ByteBuffer.allocate(4).putInt((int) address).array());
  }

  private static final class Builder {
    Path dataFile;
    Path snmpV3File;
    int devices = 100;
    long firstAddress = 0x7F00_0101L; // 127.0.1.1
    int port = 1161;
    String readCommunity = "public";
    String writeCommunity = "private";
    int logLevel = 0;
    String logFile = "tessel.log";
    boolean help;

    Builder(Path defaultData, Path defaultSnmpV3) {
      dataFile = defaultData;
      snmpV3File = defaultSnmpV3;
    }

    void set(String name, String value) throws UsageException {
      switch (knownOption(name)) {
        case "--snmp-data" -> dataFile = Path.of(nonEmpty(name, value));
        case "--snmpv3" -> snmpV3File = Path.of(nonEmpty(name, value));
        case "--devices" -> devices = number(name, value, 1, Integer.MAX_VALUE);
        case "--address" -> firstAddress = parseAddress(value);
        case "--snmp-port" -> port = number(name, value, 1, 65535);
        case "--read-community" -> readCommunity = community(name, value);
        case "--write-community" -> writeCommunity = community(name, value);
        case "--log-level" -> logLevel = number(name, value, 0, 3);
        default -> logFile = nonEmpty(name, value);
      }
    }

    LaunchOptions build() throws UsageException {
      if (firstAddress + devices - 1 > LAST_ADDRESS) {
        throw new UsageException(devices + " devices from " + dotted(firstAddress)
            + " run past 255.255.255.255");
      }
      return new LaunchOptions(dataFile, snmpV3File, devices, firstAddress, port, readCommunity, writeCommunity,
          logLevel, logFile, help);
    }
  }

  private static String nonEmpty(String name, String value) throws UsageException {
    if (value.isEmpty()) {
      throw new UsageException(name + " needs a value");
    }
    return value;
  }

  private static int number(String name, String value, int low, int high) throws UsageException {
    try {
      int number = Integer.parseInt(value);
      if (number >= low && number <= high) {
        return number;
      }
    } catch (NumberFormatException e) {
      // reported below
    }
    throw new UsageException(name + " takes a number from " + low + " to " + high + ", not '" + value + "'");
  }

  /** The engine reads a community list split at ',', so one community cannot hold one. */
  private static String community(String name, String value) throws UsageException {
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
