package com.kestrelon.simulator.tessel.snmp;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrelon.simulator.tessel.snmp.SnmpV3Config.Access;
import com.kestrelon.simulator.tessel.snmp.SnmpV3Config.Context;
import com.kestrelon.simulator.tessel.snmp.SnmpV3Config.Group;
import com.kestrelon.simulator.tessel.snmp.SnmpV3Config.User;
import com.kestrelon.simulator.tessel.snmp.SnmpV3Config.View;
import java.util.ArrayList;
import java.util.List;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

/** The SNMPv3 configuration grammar, its faults, and the calls it makes into the engine. */
class SnmpV3ConfigTest {

  @Test
  void readsEveryDirectiveWithCommentsBlanksAndEmptyStrings() throws Exception {
    SnmpV3Config config = SnmpV3Config.parse("v3.conf", """
        # users
        user alice SHA_AUTH alicepassword CFB_AES_128 alicesecret   # trailing comment
        \tuser  bob NO_AUTH - NO_PRIV -

        context ""
        group 3 alice staff
        access staff "" 3 1 2 all "" ""
        access staff ctx 0 3 1 all all all
        view all .1.3.6 "" 1
        view all 1.3.6.1.2.1.2 fFe0 2
        """);
    assertEquals(List.of(
        new User(2, "alice", "SHA_AUTH", "alicepassword", "CFB_AES_128", "alicesecret"),
        new User(3, "bob", "NO_AUTH", "", "NO_PRIV", ""),
        new Context(5, ""),
        new Group(6, 3, "alice", "staff"),
        new Access(7, "staff", "", 3, 1, 2, "all", "", ""),
        new Access(8, "staff", "ctx", 0, 3, 1, "all", "all", "all"),
        new View(9, "all", "1.3.6", "", 1),
        new View(10, "all", "1.3.6.1.2.1.2", "fFe0", 2)), config.rows());
  }

  @ParameterizedTest
  @CsvSource(delimiter = ';', value = {
      "frob 1;                                      unknown directive 'frob'",
      "user a MD5_AUTH md5password NO_PRIV;         'user' takes 5 values (NAME AUTH AUTHPASS PRIV PRIVPASS), not 4",
      "context a b;                                 'context' takes 1 values (NAME), not 2",
      "user a HMAC md5password NO_PRIV -;           unknown authentication protocol 'HMAC'",
      "user a MD5_AUTH md5password AES -;           unknown privacy protocol 'AES'",
      "user a NO_AUTH - CBC_DES despassword;        privacy needs authentication: NO_AUTH with CBC_DES",
      "user a NO_AUTH secret12 NO_PRIV -;           the password after NO_AUTH must be '-'",
      "user a MD5_AUTH md5password NO_PRIV x;       the password after NO_PRIV must be '-'",
      "user a SHA_AUTH short NO_PRIV -;             the SHA_AUTH password needs at least 8 characters",
      "user a MD5_AUTH md5password CBC_DES 1234567; the CBC_DES password needs at least 8 characters",
      "user \"\" NO_AUTH - NO_PRIV -;               the user name must have 1 to 32",
      "user a\"b NO_AUTH - NO_PRIV -;               a quote may only appear as \"\"",
      "group 4 alice staff;                         the security model must be 1, 2 or 3, not '4'",
      "group 3 alice 0123456789012345678901234567890123; the group name must have 1 to 32 characters",
      "access g \"\" 3 2 1 all all all;             the level must be 0, 1 or 3, not '2'",
      "access g \"\" 3 1 3 all all all;             the match must be 1 or 2, not '3'",
      "access g \"\" x 1 1 all all all;             the security model must be 0, 1, 2 or 3, not 'x'",
      "view v 1.3..6 \"\" 1;                        the subtree must be a dotted OID",
      "view v 1.3.6.4294967296 \"\" 1;              the subtree must be a dotted OID",
      "view v 1.3 12345678901234567 1;              the mask must be 0 to 16 hex digits",
      "view v 1.3 fg 1;                             the mask must be 0 to 16 hex digits",
      "view v 1.3 ff 0;                             the type must be 1 or 2, not '0'"})
  void faultsNameTheFileAndLine(String line, String reason) {
    SnmpV3ConfigException e = assertThrows(SnmpV3ConfigException.class,
        () -> SnmpV3Config.parse("v3.conf", "# first line\n" + line + "\n"));
    assertTrue(e.getMessage().startsWith("v3.conf:2: " + reason), e.getMessage());
  }

  @Test
  void aUserMayBeDefinedOnlyOnce() {
    SnmpV3ConfigException e = assertThrows(SnmpV3ConfigException.class, () -> SnmpV3Config.parse("v3.conf",
        "user a NO_AUTH - NO_PRIV -\nuser b NO_AUTH - NO_PRIV -\n\nuser a MD5_AUTH md5password NO_PRIV -\n"));
    assertEquals("v3.conf:4: user 'a' is already defined at line 1", e.getMessage());
  }

  /** Records the calls; answers each add with the next of the given results. */
  private static final class RecordingEngine extends SerToCConverter {
    final List<String> calls = new ArrayList<>();
    private final int[] results;

    RecordingEngine(int... results) {
      this.results = results;
    }

    private int record(String call) {
      calls.add(call);
      return calls.size() <= results.length ? results[calls.size() - 1] : 1;
    }

    @Override
    public int nativeAddUsmUserEntry(String user, String auth, String authPassword, String priv,
        String privPassword, int discoveryTimeFlag) {
      return record("user " + user + " " + auth + " " + authPassword + " " + priv + " [" + privPassword + "] "
          + discoveryTimeFlag);
    }

    @Override
    public int nativeAddContextEntry(String name) {
      return record("context [" + name + "]");
    }

    @Override
    public int nativeAddSecurityToGroupEntry(int model, String name, String group, int unused, int storage) {
      return record("group " + model + " " + name + " " + group + " " + storage);
    }

    @Override
    public int nativeAddAccessEntry(String group, String prefix, int model, int level, int match,
        String read, String write, String notify, int storage, int unused) {
      return record("access " + group + " [" + prefix + "] " + model + " " + level + " " + match + " " + read
          + " [" + write + "] " + notify + " " + storage);
    }

    @Override
    public int nativeAddViewTreeEntry(String view, String subtree, String mask, int type, int storage,
        int unused) {
      return record("view " + view + " " + subtree + " [" + mask + "] " + type + " " + storage);
    }

    @Override
    public void nativeCreateLCDVectors() {
      calls.add("rebuild");
    }
  }

  private static final String ALL_DIRECTIVES = """
      user u MD5_AUTH md5password NO_PRIV -
      context ""
      group 3 u g
      access g "" 3 1 1 all "" all
      view all .1.3 "" 1
      """;

  @Test
  void applyHandsEveryRowToTheEngineInOrderThenRebuildsTheDecisionLists() throws Exception {
    RecordingEngine engine = new RecordingEngine();
    SnmpV3Config.parse("v3.conf", ALL_DIRECTIVES).apply(engine);
    assertEquals(List.of("user u MD5_AUTH md5password NO_PRIV [] 1", "context []", "group 3 u g 3",
        "access g [] 3 1 1 all [] all 3", "view all 1.3 [] 1 3", "rebuild"), engine.calls);
  }

  @Test
  void aRowTheEngineDoesNotAddStopsTheApplyAtItsLine() throws Exception {
    RecordingEngine refusing = new RecordingEngine(1, 1, 0);
    SnmpV3Config config = SnmpV3Config.parse("v3.conf", ALL_DIRECTIVES);
    SnmpV3ConfigException e = assertThrows(SnmpV3ConfigException.class, () -> config.apply(refusing));
    assertEquals("v3.conf:3: the engine refused this row", e.getMessage());
    assertEquals(3, refusing.calls.size(), "nothing after the refused row, no rebuild");

    RecordingEngine exhausted = new RecordingEngine(99);
    e = assertThrows(SnmpV3ConfigException.class, () -> config.apply(exhausted));
    assertEquals("v3.conf:1: the engine ran out of memory", e.getMessage());
  }
}
