package com.kestrelon.simulator.tessel.network;

import com.kestrelon.simulator.tessel.cli.CliData;
import com.kestrelon.simulator.tessel.control.Notification;
import com.kestrelon.simulator.tessel.data.ValueText;
import com.kestrelon.simulator.tessel.tl1.TL1Data;
import com.kestrelon.simulator.tessel.tl1.TL1User;
import java.nio.ByteBuffer;
import java.time.Duration;
import java.nio.file.Path;
import java.util.List;
import java.util.Optional;
import java.util.OptionalInt;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

/**
 * A simulated network as a network file describes it: groups of devices, each group on a range of
 * consecutive IPv4 addresses, plus where the engine logs, where the control interface listens and
 * where a run keeps what the next one needs. Immutable; every path is resolved already.
 *
 * @param admin where the control interface listens; empty when it is off
 * @param stateDir the folder a run keeps state in for the next run
 * @param groups the device groups in file order; their address ranges do not overlap
 * @param trapSinks the managers that receive the standard traps of every device
 */
public record Network(Log log, Optional<Admin> admin, Path stateDir, List<Group> groups, List<TrapSink> trapSinks) {

  public Network {
    groups = List.copyOf(groups);
    trapSinks = List.copyOf(trapSinks);
  }

  /** A network without trap sinks. */
  public Network(Log log, Optional<Admin> admin, Path stateDir, List<Group> groups) {
    this(log, admin, stateDir, groups, List.of());
  }

  /**
   * A manager that receives the standard traps (coldStart, authenticationFailure) of devices, in
   * its own version: SNMPv1 and SNMPv2c with a community, SNMPv3 as a user of the devices' SNMPv3
   * configuration in a context. An inform sink waits {@code timeout} seconds for each answer and
   * sends {@code retries} more times.
   */
  public record TrapSink(String version, String address, int port, String community, String user,
      String context, boolean inform, int timeout, int retries) {
    public static final List<String> VERSIONS = List.of("v1", "v2c", "v3");

    /** The engine's number for the version: 0, 1 or 3. */
    public int versionNumber() {
      return switch (version) {
        case "v1" -> 0;
        case "v2c" -> 1;
        default -> 3;
      };
    }
  }

  /** The total number of devices. */
  public long devices() {
    return groups.stream().mapToLong(Group::count).sum();
  }

  /**
   * The agent id of device 0 of {@code group}: ids run through the groups in file order, one per
   * device, shared by every protocol the device serves.
   */
  public int firstAgentId(Group group) {
    int first = 0;
    for (Group each : groups) {
      if (each == group) {
        return first;
      }
      first += each.count();
    }
    throw new IllegalArgumentException("group " + group.name() + " is not in this network");
  }

  /** The engine's log: level 0 (no log) to 3 (every operation), and its file. */
  public record Log(int level, Path file) {}

  /** The address the control interface listens on: a host name or IP literal and a TCP port. */
  public record Admin(String host, int port) {
    private static final Pattern LISTEN = Pattern.compile("(?:\\[([^\\]]+)\\]|([^:\\[\\]]+)):([0-9]{1,5})");

    /**
     * {@code HOST:PORT} or {@code [IPv6]:PORT} (port 0: one the system picks); empty for
     * {@code off}; null when it is neither.
     */
    public static Optional<Admin> parse(String text) {
      if (text.equals("off")) {
        return Optional.empty();
      }
      Matcher address = LISTEN.matcher(text);
      if (!address.matches() || Integer.parseInt(address.group(3)) > 65535) {
        return null;
      }
      return Optional.of(new Admin(address.group(1) != null ? address.group(1) : address.group(2),
          Integer.parseInt(address.group(3))));
    }

    /** What {@link #parse} takes, for messages. */
    public static String expected() {
      return "HOST:PORT (such as 127.0.0.1:8161 or [::1]:8161) or off";
    }
  }

  /**
   * Devices that share their protocols and data. Device i (0-based) is at {@code firstAddress + i}.
   *
   * @param firstAddress the IPv4 address of device 0 as an unsigned 32-bit number
   * @param deviceName the name template: {@code {n}} stands for the 1-based number of the device
   *     in the group, {@code {address}} for its address
   * @param snmp the group's SNMP agents; empty when the group serves no SNMP
   * @param trapSinks the managers that receive its devices' standard traps, besides the network's
   * @param notifications what every device of the group sends on a timer
   * @param tl1 the group's TL1 agents; empty when the group serves no TL1
   * @param cli the group's CLI agents; empty when the group serves no CLI
   */
  public record Group(String name, int count, long firstAddress, String deviceName, Optional<Snmp> snmp,
      List<TrapSink> trapSinks, List<Scheduled> notifications, Optional<Tl1> tl1, Optional<Cli> cli) {

    public Group {
      trapSinks = List.copyOf(trapSinks);
      notifications = List.copyOf(notifications);
    }

    /** A group without CLI. */
    public Group(String name, int count, long firstAddress, String deviceName, Optional<Snmp> snmp,
        List<TrapSink> trapSinks, List<Scheduled> notifications, Optional<Tl1> tl1) {
      this(name, count, firstAddress, deviceName, snmp, trapSinks, notifications, tl1, Optional.empty());
    }

    /** A group without TL1. */
    public Group(String name, int count, long firstAddress, String deviceName, Optional<Snmp> snmp,
        List<TrapSink> trapSinks, List<Scheduled> notifications) {
      this(name, count, firstAddress, deviceName, snmp, trapSinks, notifications, Optional.empty());
    }

    /** A group that sends nothing on a timer. */
    public Group(String name, int count, long firstAddress, String deviceName, Optional<Snmp> snmp,
        List<TrapSink> trapSinks) {
      this(name, count, firstAddress, deviceName, snmp, trapSinks, List.of());
    }

    /** A group without trap sinks of its own. */
    public Group(String name, int count, long firstAddress, String deviceName, Optional<Snmp> snmp) {
      this(name, count, firstAddress, deviceName, snmp, List.of());
    }

    public long lastAddress() {
      return firstAddress + count - 1;
    }

    /** The dotted address of device {@code index} (0-based). */
    public String address(int index) {
      return dotted(firstAddress + index);
    }

    /** The name of device {@code index} (0-based). */
    public String deviceName(int index) {
      return deviceName.replace("{n}", Integer.toString(index + 1)).replace("{address}", address(index));
    }
  }

  /**
   * A notification every device of a group sends once per {@code every}.
   *
   * @param toSinks true when it goes to each of the device's trap sinks, in the sink's version,
   *     with the sink's identity, timeout and retries; then {@code notification} gives only its
   *     kind, its form and its bindings
   * @param notification what is sent and, unless {@code toSinks}, to whom
   */
  public record Scheduled(Duration every, boolean toSinks, Notification notification) {}

  /**
   * The SNMP agent every device of a group runs.
   *
   * @param port the UDP port; the engine also binds {@link #notificationPort()} on every address
   * @param data the device data each agent starts from
   * @param v3 the SNMPv3 users, contexts, groups, access rows and views, if any
   * @param readCommunity the community for reads
   * @param writeCommunity the community for writes, also accepted for reads
   */
  public record Snmp(int port, Path data, Optional<Path> v3, String readCommunity, String writeCommunity) {

    public int notificationPort() {
      return port + 1;
    }
  }

  /**
   * The TL1 agent every device of a group runs; the device's name is its SID.
   *
   * @param port the TCP port of raw sessions
   * @param telnetPort the TCP port of interactive (Telnet) sessions, if any
   * @param keepAlive seconds a silent session stays open; 0 for ever
   * @param data the answers to commands, read from {@code dataFile}
   * @param users the users ACT-USER accepts
   * @param requireLogin whether a session must log in before any other command
   * @param where where the section was given: {@code FILE:LINE}, or the flag
   */
  public record Tl1(int port, OptionalInt telnetPort, int keepAlive, Path dataFile, TL1Data data,
      List<TL1User> users, boolean requireLogin, String where) {
    public static final int DEFAULT_PORT = 3083;

    public Tl1 {
      users = List.copyOf(users);
    }
  }

  /**
   * The CLI agent every device of a group runs: Telnet on {@code port}, SSH on {@code sshPort} if
   * given, one login user and an enable secret (none when empty); the device's name is its
   * hostname until a session changes it.
   *
   * @param data the commands and the starting configuration, read from {@code dataFile}
   * @param where where the section was given: {@code FILE:LINE}, or the flag
   */
  public record Cli(int port, OptionalInt sshPort, Path dataFile, CliData data, String user, String password,
      String enable, String where) {
    public static final int DEFAULT_PORT = 2323;
    public static final String DEFAULT_USER = "admin";
    public static final String DEFAULT_PASSWORD = "admin";
    public static final String DEFAULT_ENABLE = "enable";

    /** The listeners one device holds: Telnet, and SSH when it has a port. */
    public int sockets() {
      return sshPort.isPresent() ? 2 : 1;
    }

    /** What the control interface shows: no secret. */
    @Override
    public String toString() {
      return "Cli[port=" + port + ", sshPort=" + sshPort + ", dataFile=" + dataFile + ", user=" + user + "]";
    }
  }

  /** The dotted text of an IPv4 address held as an unsigned 32-bit number. */
  public static String dotted(long address) {
    return ValueText.ipText(ByteBuffer.allocate(4).putInt((int) address).array());
  }
}
