package com.kestrelon.simulator.tessel.cli;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrelon.simulator.tessel.cli.CliData.Action;
import com.kestrelon.simulator.tessel.cli.CliData.Command;
import com.kestrelon.simulator.tessel.data.DeviceDataException;
import java.util.List;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

/** CLI data files: what a section declares, the modes a file adds, and that faults name their line. */
class CliDataTest {
  @Test
  void sectionsDeclareCommandsWithTheirActionsAndAddedModesTheirPromptFiles() throws Exception {
    CliData data = CliData.parse("small.cli", """
        # a device
        interface-types GigabitEthernet Loopback
        mode dhcp 16 (dhcp-config)#
        mode qos 20 (config-pmap)#\r

        [user, enable]
        show version "System status"
        | Version 1
        |
        terminal length NUMBER "Set number of lines"
        [config]
        ip dhcp pool WORD "Configure a DHCP pool" -> dhcp
        ip route WORD WORD WORD "Establish static routes"
        [dhcp]
        ? network "Network number"
        network WORD [WORD] "Network number and mask" => set
        """);
    Command version = data.commands(CliData.ENABLE).get(0);
    assertEquals(List.of(Action.OUTPUT, List.of("Version 1", ""), 7), List.of(version.action(), version.output(),
        version.line()));
    assertEquals(Action.SILENT, data.commands(CliData.USER).get(1).action());
    assertEquals(List.of(Action.MODE, 16, true, "ip dhcp pool"), List.of(data.commands(CliData.CONFIG).get(0).action(),
        data.commands(CliData.CONFIG).get(0).targetMode(), data.commands(CliData.CONFIG).get(0).opensBlock(),
        data.commands(CliData.CONFIG).get(0).key()));
    assertEquals(Action.ADD, data.commands(CliData.CONFIG).get(1).action());
    assertEquals("Network number", data.help(16, "network"));
    assertEquals(List.of("(dhcp-config)#", "(config-router)#", ">"),
        List.of(data.promptSuffix(16), data.promptSuffix(14), data.promptSuffix(CliData.USER)));
    assertEquals("dhcp=16\nqos=20\n", data.modesFile());
    assertEquals("dhcp=(dhcp-config)#;\nqos=(config-pmap)#;\n", data.promptsFile());
  }

  @ParameterizedTest(name = "{1}")
  @CsvSource(delimiter = ';', value = {
      "[user]\\nshow version;                   2: a command reads PATTERN \"HELP\"",
      "[user]\\nshow \"status;                  2: the help text is not closed",
      "[user]\\n\\nshow \"s\" -> nowhere;        3: unknown mode 'nowhere'",
      "[user]\\nshow \"s\" => print;            2: unknown action 'print'",
      "[user]\\nshow \"s\" -> enable => write;  2: after the help comes one",
      "[user]\\nshow WORD LINE NUMBER \"s\";     2: LINE takes the rest of the line",
      "[user]\\nshow [WORD] NUMBER \"s\";        2: 'NUMBER' follows an optional token",
      "[user]\\nshow IFNAME \"s\";               2: unknown placeholder 'IFNAME'",
      "[user]\\nWORD \"s\";                      2: a command starts with a keyword",
      "[user]\\nip route WORD \"s\" => set;      2: => set stores a line in the configuration",
      "[user]\\nshow \"a\"\\nShow \"b\";         3: a second command 'Show' in its mode (the first is on line 2)",
      "[user]\\nping WORD \"p\" => silent\\n| x; 3: the command on line 2 has an action",
      "[user]\\n| x;                            2: an output line without a command",
      "[users]\\nshow \"s\";                     1: unknown mode 'users'",
      "mode dhcp 15 (x)#\\n[user]\\nx \"x\";     1: mode dhcp takes a number above 15",
      "mode vlan 16 (x)#\\n[user]\\nx \"x\";     1: a second mode named vlan",
      "mode a 16;                              1: a mode line reads 'mode NAME NUMBER SUFFIX'",
      "show \"s\";                             1: 'show \"s\"' before the first section",
      "[user]\\nx \"x\"\\n[running-config]\\n interface x; 4: an indented configuration line outside a block",
      "# nothing;                              1: the file has no command section"})
  void eachFaultNamesItsLine(String text, String expected) {
    DeviceDataException fault = assertThrows(DeviceDataException.class,
        () -> CliData.parse("bad.cli", text.replace("\\n", "\n")));
    assertTrue(fault.getMessage().startsWith("bad.cli:" + expected), fault.getMessage());
  }
}
