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
      "user a NO_AUTH - NO_PRIV -\\nuser a MD5_AUTH md5password NO_PRIV -; 3: user 'a' is already defined at line 2",
      "user a MD5_AUTH md5password NO_PRIV;         'user' takes 5 values (NAME AUTH AUTHPASS PRIV PRIVPASS), not 4",
      "user a HMAC md5password NO_PRIV -;           unknown authentication protocol 'HMAC'",
      "user a NO_AUTH - CBC_DES despassword;        privacy needs authentication: NO_AUTH with CBC_DES",
      "user a NO_AUTH secret12 NO_PRIV -;           the password after NO_AUTH must be '-'",
      "user a SHA_AUTH short NO_PRIV -;             the SHA_AUTH password needs at least 8 characters",
      "user \"\" NO_AUTH - NO_PRIV -;               the user name must have 1 to 32",
      "user a\"b NO_AUTH - NO_PRIV -;               a quote may only appear as \"\"",
      "group 4 alice staff;                         the security model must be 1, 2 or 3, not '4'",
      "access g \"\" 3 2 1 all all all;             the level must be 0, 1 or 3, not '2'",
      "view v 1.3..6 \"\" 1;                        the subtree must be a dotted OID",
      "view v 1.3 12345678901234567 1;              the mask must be 0 to 16 hex digits",
      "view v 1.3 ff 0;                             the type must be 1 or 2, not '0'"})
  void faultsNameTheFileAndLine(String line, String reason) {
    SnmpV3ConfigException e = assertThrows(SnmpV3ConfigException.class,
        () -> SnmpV3Config.parse("v3.conf", "# first line\n" + line.replace("\\n", "\n") + "\n"));
    String expected = reason.matches("[0-9]+: .*") ? reason : "2: " + reason;
    assertTrue(e.getMessage().startsWith("v3.conf:" + expected), e.getMessage());
  }

  @Test
  void applyHandsTheRowsToTheEngineInOrderAndStopsAtTheFirstItRefuses() throws Exception {
    SnmpV3Config config = SnmpV3Config.parse("v3.conf", """
        user u MD5_AUTH md5password NO_PRIV -
        context ""
        group 3 u g
        view all .1.3 "" 1
        """);
    List<Integer> calls = new ArrayList<>();
    config.apply(row -> calls.add(row.line()) ? 1 : 0, () -> calls.add(0));
    assertEquals(List.of(1, 2, 3, 4, 0), calls, "every row in file order, then the rebuild");

    calls.clear();
    SnmpV3ConfigException e = assertThrows(SnmpV3ConfigException.class,
        () -> config.apply(row -> calls.add(row.line()) && row.line() < 3 ? 1 : 0, () -> calls.add(0)));
    assertEquals("v3.conf:3: the engine refused this row", e.getMessage());
    assertEquals(List.of(1, 2, 3), calls, "nothing after the refused row, no rebuild");
    e = assertThrows(SnmpV3ConfigException.class, () -> config.apply(row -> 99, () -> { }));
    assertEquals("v3.conf:1: the engine ran out of memory", e.getMessage());
  }
}
