package com.kestrelon.simulator.tessel.network;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertSame;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrelon.simulator.tessel.network.Network.Admin;
import com.kestrelon.simulator.tessel.network.Network.Group;
import com.kestrelon.simulator.tessel.network.Network.Log;
import com.kestrelon.simulator.tessel.network.Network.Scheduled;
import com.kestrelon.simulator.tessel.network.Network.Snmp;
import com.kestrelon.simulator.tessel.network.Network.Tl1;
import com.kestrelon.simulator.tessel.network.Network.TrapSink;
import com.kestrelon.simulator.tessel.tl1.TL1User;
import java.nio.file.Files;
import java.nio.file.Path;
import java.time.Duration;
import java.util.List;
import java.util.Optional;
import java.util.stream.Stream;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.Arguments;
import org.junit.jupiter.params.provider.MethodSource;

/** Network files: what a good one describes, and that every fault names its line. */
class NetworkFileTest {
  /** Every fault case starts with this valid group on lines 1 and 2. */
  private static final String FIRST_GROUP = """
      groups:
        - {name: a, count: 10, address: 127.0.1.1, snmp: {data: d.snmprec}}
      """;

  /** A group whose notifications list starts on line 8. */
  private static final String TIMED =
      "  - name: b\n    count: 1\n    address: 127.0.2.1\n    snmp: {data: d.snmprec}\n    notifications:\n";

  /** A group whose tl1 section starts on line 6. */
  private static final String TL1 = "  - name: b\n    count: 1\n    address: 127.0.2.1\n    tl1: ";

  /** A group whose cli section starts on line 6. */
  private static final String CLI = "  - name: b\n    count: 1\n    address: 127.0.2.1\n    cli: ";

  @TempDir
  Path dir;

  static Stream<Arguments> faults() {
    return Stream.of(
        fault("sate-dir: /tmp\n", "3: unknown key 'sate-dir' in the network"),
        fault("  - {name: b, cont: 1, address: 127.0.2.1, snmp: {data: d.snmprec}}\n",
            "3: unknown key 'cont' in a group"),
        fault("  - {name: b, count: 1, address: 127.0.2.1, snmp: {data: d.snmprec, prot: 1}}\n",
            "3: unknown key 'prot' in snmp"),
        fault("  - {name: b, count: 1, count: 2, address: 127.0.2.1, snmp: {data: d.snmprec}}\n",
            "3: a second 'count' in a group"),
        fault("  - {name: b, count: 0, address: 127.0.2.1, snmp: {data: d.snmprec}}\n",
            "3: count takes a whole number from 1 to 2147483647, not '0'"),
        fault("  - {name: b, count: [1], address: 127.0.2.1, snmp: {data: d.snmprec}}\n",
            "3: count takes a whole number"),
        fault("  - {name: b, address: 127.0.2.1, snmp: {data: d.snmprec}}\n", "3: a group needs 'count'"),
        fault("  - name: b\n    count: 1\n    address:\n      127.0.2.300\n",
            "5: address takes an IPv4 address such as 127.0.1.1, not '127.0.2.300'"),
        fault("  - {name: b, count: 1, address: 127.0.2.1, snmp: {data: d.snmprec, port: 65535}}\n",
            "3: port takes a whole number from 1 to 65534"),
        fault("  - {name: b, count: 1, address: 127.0.2.1, device-name: 'B{x}', snmp: {data: d.snmprec}}\n",
            "3: device-name may hold {n} and {address}"),
        fault("  - {name: b, count: 1, address: 127.0.2.1, snmp: {data: d.snmprec, read-community: 'a,b'}}\n",
            "3: read-community cannot hold ','"),
        fault("  - name: b\n    count: 1\n    address: 127.0.2.1\n    snmp: {data: gone.snmprec}\n",
            "6: data file "),
        fault("  - name: b\n    count: 1\n    address: 127.0.2.1\n    snmp: {data: d.snmprec, v3: gone.conf}\n",
            "6: v3 file "),
        fault("  - name: b\n    count: 17\n    address: 255.255.255.240\n",
            "5: 17 devices from 255.255.255.240 run past"),
        fault("  - name: b\n    count: 5\n    address: 127.0.1.10\n    snmp: {data: d.snmprec}\n",
            "5: addresses 127.0.1.10 to 127.0.1.14 overlap group a (127.0.1.1 to 127.0.1.10)"),
        fault("  - name: b\n    count: 5\n    address: 127.0.0.253\n    snmp: {data: d.snmprec}\n",
            "5: addresses 127.0.0.253 to 127.0.1.1 overlap group a"),
        fault("  - {name: a, count: 1, address: 127.0.2.1, snmp: {data: d.snmprec}}\n", "3: a second group named 'a'"),
        fault("  - {count: 1, address: 127.0.2.1,\n     name: b}\n", "4: group b has no protocol section"),
        fault("  - {name: b, count: 1, address: 127.0.2.1,\n     snmp: {data: d.snmprec, port: 1162}}\n",
            "4: SNMP port 1162 clashes with the notification port of group a"),
        fault("  - {name: b, count: 1, address: 127.0.2.1, snmp: {data: d.snmprec, port: 1160}}\n",
            "3: notification port 1161 clashes with the SNMP port of group a"),
        fault(TL1 + "{data: d.tl1, pot: 1}\n", "6: unknown key 'pot' in tl1"),
        fault(TL1 + "{port: 3083}\n", "6: tl1 needs 'data'"),
        fault(TL1 + "{data: gone.tl1}\n", "6: data file "),
        fault(TL1 + "{data: d.tl1, port: 0}\n", "6: port takes a whole number from 1 to 65535, not '0'"),
        fault(TL1 + "{data: d.tl1, port: 3083,\n           telnet-port: 3083}\n",
            "7: telnet-port 3083 is the raw TL1 port too"),
        fault(TL1 + "{data: d.tl1, telnet-port: 65536}\n", "6: telnet-port takes a whole number from 1 to 65535"),
        fault(TL1 + "{data: d.tl1, keepalive: -1}\n", "6: keepalive takes a whole number from 0"),
        fault(TL1 + "{data: d.tl1, require-login: yes, users: [{user: a, password: b}]}\n",
            "6: require-login takes true or false"),
        fault(TL1 + "{data: d.tl1, require-login: true}\n", "6: require-login needs users"),
        fault(TL1 + "{data: d.tl1, users: {user: a}}\n", "6: users takes a list of users"),
        fault(TL1 + "\n      data: d.tl1\n      users:\n        - {user: a, password: b}\n        - {user: a, password: c}\n",
            "10: a second user 'a'"),
        fault(TL1 + "{data: d.tl1, users: [{user: a}]}\n", "6: a user needs 'password'"),
        fault(TL1 + "{data: d.tl1, port: 2323}\n    cli: {port: 2323}\n", "7: port 2323 is another listener's port"),
        fault(TL1 + "{data: d.tl1}\n    cli: {ssh-port: 3083}\n", "7: ssh-port 3083 is another listener's port"),
        fault(CLI + "{port: 2323, ssh-port: 2323}\n", "6: ssh-port 2323 is another listener's port"),
        fault(CLI + "{data: gone.cli}\n", "6: data file "),
        fault(CLI + "{user: ''}\n", "6: user takes a non-empty text"),
        fault(CLI + "{users: [a]}\n", "6: unknown key 'users' in cli"),
        fault("trap-sinks: [127.0.0.1:162]\n", "3: a trap sink takes a mapping of version"),
        fault("trap-sinks:\n  - {version: v4, address: h}\n", "4: version takes v1, v2c or v3, not 'v4'"),
        fault("trap-sinks:\n  - {version: v2c, address: h, kind: note}\n", "4: kind takes trap or inform"),
        fault("trap-sinks:\n  - {version: v1, address: h, kind: inform}\n", "4: SNMPv1 has no inform"),
        fault("trap-sinks:\n  - {version: v3, address: h}\n", "4: a v3 sink needs 'user'"),
        fault("trap-sinks:\n  - {version: v3, address: h, user: u, community: c}\n",
            "4: a v3 sink takes user and context, not community"),
        fault("trap-sinks:\n  - {version: v2c, address: h, user: u}\n", "4: a v2c sink takes community, not user"),
        fault("trap-sinks:\n  - {version: v2c, address: h, port: 65536}\n", "4: port takes a whole number from 1 to 65535"),
        fault("trap-sinks:\n  - {version: v2c, adress: h}\n", "4: unknown key 'adress' in a trap sink"),
        fault("  - {name: b, count: 1, address: 127.0.2.1, snmp: {data: d.snmprec},\n     trap-sinks: [{version: v2c}]}\n",
            "4: a trap sink needs 'address'"),
        fault(TIMED + "      - {every: 50ms, to: sinks, oid: 1.3.6.1.4.1.9}\n",
            "8: every takes a period from 100ms to 24h, not 50ms"),
        fault(TIMED + "      - {every: 1 s, to: sinks, oid: 1.3.6.1.4.1.9}\n", "8: every takes a period such as"),
        fault(TIMED + "      - {every: 1s, to: sinks, oid: 1.3.6.1.4.1.9, evry: 2s}\n",
            "8: unknown key 'evry' in a notification"),
        fault(TIMED + "      - {every: 1s, oid: 1.3.6.1.4.1.9}\n", "8: a notification needs 'to'"),
        fault(TIMED + "      - every: 1s\n        to: sinks\n        community: c\n",
            "10: community comes from each sink"),
        fault(TIMED + "      - every: 1s\n        to: 127.0.0.1:99999\n        oid: 1.3.6.1\n",
            "9: manager: the port is a number from 1 to 65535"),
        fault(TIMED + "      - every: 1s\n        to: sinks\n        version: v1\n        generic: 6\n",
            "8: no enterprise given"),
        fault(TIMED + "      - every: 1s\n        to: sinks\n        oid: 1.3.6.1\n        varbinds:\n"
            + "          - {oid: 1.3.6.1.2, type: i, value: 1}\n          - {oid: 1.3.6.1.2, type: q, value: 1}\n",
            "13: varbind 2: unknown type 'q'"),
        fault(TIMED + "      - {every: 1s, to: sinks, kind: inform, version: v1, enterprise: 1.3.6.1.4.1.9}\n",
            "8: SNMPv1 has no inform"),
        fault("log: {level: 4}\n", "3: level takes a whole number from 0 to 3"),
        fault("admin: {listen: 127.0.0.1}\n", "3: listen takes HOST:PORT"),
        fault("state-dir: [a\n", "4: "));
  }

  @Test
  void readsTl1SectionsWithTheirDefaultsAndAGroupWithoutSnmp() throws Exception {
    Path file = write(FIRST_GROUP.replace("d.snmprec}}", "d.snmprec}, tl1: {data: d.tl1}}")
        + "  - name: b\n    count: 2\n    address: 127.0.2.1\n    tl1: {data: d.tl1, port: 4000, telnet-port: 4023,\n"
        + "          keepalive: 60, require-login: true, users: [{user: admin, password: 'p w'}, {user: u, password: v}]}\n");
    List<Group> groups = NetworkFile.read(file).groups();
    Tl1 plain = groups.get(0).tl1().orElseThrow();
    assertEquals(List.of("3083", "", "0", "[]", "false", file + ":2"), List.of("" + plain.port(),
        plain.telnetPort().isPresent() ? "x" : "", "" + plain.keepAlive(), "" + plain.users(), "" + plain.requireLogin(),
        plain.where()));
    Tl1 full = groups.get(1).tl1().orElseThrow();
    assertEquals(Optional.empty(), groups.get(1).snmp());
    assertEquals(List.of(4000, 4023, 60), List.of(full.port(), full.telnetPort().getAsInt(), full.keepAlive()));
    assertEquals(List.of(new TL1User("admin", "p w"), new TL1User("u", "v")), full.users());
    assertTrue(full.requireLogin());
    assertEquals(dir.resolve("d.tl1"), full.dataFile());
    assertSame(plain.data(), full.data(), "a data file is read once");
    assertEquals(List.of("RTRV-HDR"), full.data().codes());
  }

  @Test
  void faultsOfATl1DataFileNameItsOwnLine() throws Exception {
    Path file = write("groups:\n" + TL1 + "{data: d.tl1}\n");
    Files.writeString(dir.resolve("d.tl1"), "[RTRV-HDR]\nCOMPLD\n\n[RTRV-ALM]\nDENY XXXX\n");
    NetworkFileException fault = assertThrows(NetworkFileException.class, () -> NetworkFile.read(file));
    assertTrue(fault.getMessage().startsWith(dir.resolve("d.tl1") + ":5: DENY takes one code"), fault.getMessage());
  }

  @Test
  void readsCliSectionsWithTheirDefaultsAndTheirDataFilesFaults() throws Exception {
    Files.writeString(dir.resolve("r.cli"), "[user]\nshow version \"v\"\n");
    Path file = write("groups:\n" + CLI + "{}\n  - {name: c, count: 1, address: 127.0.3.1,\n"
        + "     cli: {port: 23, ssh-port: 22, data: r.cli, user: u, password: p, enable: ''}}\n");
    List<Group> groups = NetworkFile.read(file).groups();
    Network.Cli plain = groups.get(0).cli().orElseThrow();
    assertEquals(List.of("2323", "false", "admin", "admin", "enable", file + ":5"), List.of("" + plain.port(),
        "" + plain.sshPort().isPresent(), plain.user(), plain.password(), plain.enable(), plain.where()));
    assertEquals(NetworkFile.defaultCliData(), plain.dataFile());
    assertEquals(Optional.empty(), groups.get(0).snmp());
    Network.Cli full = groups.get(1).cli().orElseThrow();
    assertEquals(List.of(23, 22), List.of(full.port(), full.sshPort().getAsInt()));
    assertEquals(List.of("u", "p", ""), List.of(full.user(), full.password(), full.enable()));
    assertEquals(dir.resolve("r.cli"), full.dataFile());
    assertFalse(full.toString().contains("p,") || full.toString().contains("password"), full.toString());
    Files.writeString(dir.resolve("r.cli"), "[user]\nshow version\n");
    NetworkFileException fault = assertThrows(NetworkFileException.class, () -> NetworkFile.read(file));
    assertTrue(fault.getMessage().startsWith(dir.resolve("r.cli") + ":2: a command reads"), fault.getMessage());
  }

  @Test
  void readsTrapSinksOfTheNetworkAndOfAGroup() throws Exception {
    Path file = write(FIRST_GROUP.replace("d.snmprec}}", "d.snmprec},\n     trap-sinks: [{version: v3, address: h, user: u}]}")
        + "trap-sinks:\n  - {version: v2c, address: 127.0.0.1, port: 1162, kind: inform, timeout: 2, retries: 1}\n");
    Network network = NetworkFile.read(file);
    assertEquals(List.of(new TrapSink("v2c", "127.0.0.1", 1162, "public", "", "", true, 2, 1)), network.trapSinks());
    assertEquals(List.of(new TrapSink("v3", "h", 162, "", "u", "", false, 5, 0)), network.groups().get(0).trapSinks());
  }

  @Test
  void readsScheduledNotificationsWithTheControlInterfacesChecks() throws Exception {
    Path file = write(FIRST_GROUP.replace("d.snmprec}}", "d.snmprec},\n     notifications: [\n"
        + "       {every: 1500ms, to: sinks, version: v1, enterprise: 1.3.6.1.4.1.9, specific: 7},\n"
        + "       {every: 5m, to: '[::1]:1162', kind: inform, version: v3, user: u, oid: 1.3.6.1.4.1.9.1,\n"
        + "        retries: 2, varbinds: [{oid: 1.3.6.1.2.1.1.5.0, type: s, value: up}]}]}"));
    List<Scheduled> scheduled = NetworkFile.read(file).groups().get(0).notifications();
    assertEquals(2, scheduled.size());
    Scheduled v1 = scheduled.get(0);
    assertEquals(Duration.ofMillis(1500), v1.every());
    assertTrue(v1.toSinks());
    assertEquals(List.of(".1.3.6.1.4.1.9", "6", "7", "false"), List.of(v1.notification().enterprise(),
        "" + v1.notification().generic(), "" + v1.notification().specific(), "" + v1.notification().inform()));
    Scheduled inform = scheduled.get(1);
    assertEquals(Duration.ofMinutes(5), inform.every());
    assertEquals(List.of("false", "::1", "1162", "u", "2", ".1.3.6.1.2.1.1.5.0"), List.of("" + inform.toSinks(),
        inform.notification().managerHost(), "" + inform.notification().managerPort(), inform.notification().user(),
        "" + inform.notification().retries(), inform.notification().bindings().get(0).oid()));
  }

  private static Arguments fault(String rest, String expected) {
    return Arguments.of(FIRST_GROUP + rest, expected);
  }

  @ParameterizedTest(name = "{1}")
  @MethodSource("faults")
  void eachFaultNamesItsLine(String yaml, String expected) throws Exception {
    Path file = write(yaml);
    NetworkFileException fault = assertThrows(NetworkFileException.class, () -> NetworkFile.read(file));
    assertTrue(fault.getMessage().startsWith(file + ":" + expected), fault.getMessage());
  }

  @Test
  void readsGroupsWithDefaultsAndPathsRelativeToTheFile() throws Exception {
    Files.createDirectories(dir.resolve("conf"));
    Files.writeString(dir.resolve("conf/v3.conf"), "");
    Path file = write("""
        log: {level: 2, file: logs/t.log}
        admin: {listen: '[::1]:9000'}
        state-dir: state
        trap-sinks: []
        groups:
          - name: core
            count: 3
            address: 10.0.0.254
            device-name: "C{n}@{address}"
            snmp: {port: 2161, data: d.snmprec, v3: conf/../conf/v3.conf, read-community: r, write-community: w}
          - {name: edge, count: 2, address: 10.0.1.1, snmp: {data: ./d.snmprec}}
        """);
    Network network = NetworkFile.read(file);
    Snmp coreSnmp = new Snmp(2161, dir.resolve("d.snmprec"), Optional.of(dir.resolve("conf/v3.conf")), "r", "w");
    Snmp edgeSnmp = new Snmp(1161, dir.resolve("d.snmprec"), Optional.empty(), "public", "private");
    assertEquals(new Network(new Log(2, dir.resolve("logs/t.log")), Optional.of(new Admin("::1", 9000)),
        dir.resolve("state"), List.of(new Group("core", 3, 0x0A00_00FEL, "C{n}@{address}", Optional.of(coreSnmp)),
            new Group("edge", 2, 0x0A00_0101L, "{address}", Optional.of(edgeSnmp)))), network);
    Group core = network.groups().get(0);
    assertEquals(List.of("10.0.0.254", "10.0.0.255", "10.0.1.0"),
        List.of(core.address(0), core.address(1), core.address(2)));
    assertEquals("C3@10.0.1.0", core.deviceName(2));
    assertEquals("10.0.1.2", network.groups().get(1).deviceName(1));
    assertEquals(5, network.devices());
  }

  @Test
  void adminOffDefaultsAndGroupsSharingAPort() throws Exception {
    Network network = NetworkFile.read(write("admin: off\n" + FIRST_GROUP
        + "  - {name: b, count: 1, address: 127.0.1.11, snmp: {data: d.snmprec}}\n"));
    assertEquals(Optional.empty(), network.admin());
    assertEquals(new Log(0, dir.resolve("tessel.log")), network.log());
    assertEquals(Path.of(System.getProperty("user.home"), ".local/state/tessel"), network.stateDir());
    assertEquals(Optional.empty(), NetworkFile.read(write("admin: {listen: off}\n" + FIRST_GROUP)).admin());
  }

  @Test
  void shippedDefaultNetworkIsTheHundredRoutersWithTheirCliAndTwentyOpticalElements() throws Exception {
    Path profiles = Path.of(System.getProperty("tessel.profiles.dir", "profiles")).toAbsolutePath().normalize();
    Network network = NetworkFile.read(profiles.resolve("network.yaml"));
    Snmp snmp = new Snmp(1161, profiles.resolve("router.snmprec"), Optional.of(profiles.resolve("snmpv3.conf")),
        "public", "private");
    assertEquals(2, network.groups().size());
    Group routers = network.groups().get(0);
    assertEquals(new Group("routers", 100, 0x7F00_0101L, "R{n}", Optional.of(snmp), List.of(), List.of(),
        Optional.empty(), routers.cli()), routers);
    Network.Cli cli = routers.cli().orElseThrow();
    assertEquals(List.of("2323", "2222", "admin", "admin", "enable", profiles.resolve("router.cli").toString()),
        List.of("" + cli.port(), "" + cli.sshPort().getAsInt(), cli.user(), cli.password(), cli.enable(),
            cli.dataFile().toString()));
    Group optical = network.groups().get(1);
    Tl1 tl1 = optical.tl1().orElseThrow();
    assertEquals(List.of("optical", "20", "127.0.2.1", "NE20", "false", "3083", "OptionalInt[3023]", "0", "false",
        profiles.resolve("optical.tl1").toString()), List.of(optical.name(), "" + optical.count(), optical.address(0),
        optical.deviceName(19), "" + optical.snmp().isPresent(), "" + tl1.port(), "" + tl1.telnetPort(),
        "" + tl1.keepAlive(), "" + tl1.requireLogin(), tl1.dataFile().toString()));
    assertEquals(List.of(new TL1User("admin", "admin")), tl1.users());
    assertEquals(Optional.of(new Admin("127.0.0.1", 8161)), network.admin());
    assertEquals(Path.of(System.getProperty("user.home"), ".local/state/tessel"), network.stateDir());
  }

  private Path write(String yaml) throws Exception {
    Files.writeString(dir.resolve("d.snmprec"), "1.3.6.1.2.1.1.5.0|4|x\n");
    Files.writeString(dir.resolve("d.tl1"), "[RTRV-HDR]\nCOMPLD\n");
    return Files.writeString(dir.resolve("network.yaml"), yaml);
  }
}
