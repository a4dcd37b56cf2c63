package com.kestrelon.simulator.tessel.control;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.google.gson.JsonParser;
import com.kestrelon.simulator.tessel.control.Tl1Control.PendingCommand;
import com.kestrelon.simulator.tessel.tl1.TL1AlarmImpl;
import com.kestrelon.simulator.tessel.tl1.TL1Register;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.List;
import java.util.Map;
import org.junit.jupiter.api.Test;

/** What the control interface's TL1 actions hand the engine, and how its answers are read. */
class NativeTl1ControlTest {
  private static final Device DEVICE = new Device("127.0.2.1", 0x7F000201L, 42, "NE1", "optical",
      Map.of("tl1", AgentState.RUNNING));

  private final List<String> calls = new ArrayList<>();
  private int clients;

  private final TL1AlarmImpl alarms = new TL1AlarmImpl() {
    @Override
    public int sendAutonomousBatch(String[] verbs, String[] modifiers1, String[] modifiers2, byte[] alarmCodes,
        String[][] lines, int[][] lineTypes, int agentId) {
      if (verbs.length > 0) {
        calls.add(agentId + " " + Arrays.toString(verbs) + Arrays.toString(modifiers1) + Arrays.toString(modifiers2)
            + Arrays.toString(alarmCodes) + Arrays.deepToString(lines) + Arrays.deepToString(lineTypes));
      }
      return clients;
    }

    @Override
    public void SetAtagValue(int atag, int agentId) {
      calls.add("atag " + atag + " " + agentId);
    }
  };

  private final TL1Register register = new TL1Register() {
    @Override
    public String[] listPending(int agentId) {
      return new String[] {"7\t180388626433\t5\t\t\tENT-X:NE1:A:1:ON=5;",
          "8\t180388626434\t-1\t26-12-07\t01-30-00\tED-EQPT::SLOT-5:2::DATE=26-12-07,TIME=01-30-00;"};
    }
  };

  private final NativeTl1Control control = new NativeTl1Control(register, alarms);

  @Test
  void messagesGoAsOneBatchInTheEnginesCodes() {
    clients = 2;
    List<Tl1Message> messages = Tl1Message.parseAll(JsonParser.parseString("[{\"severity\": \"non-alarm\","
        + " \"verb\": \"rept\", \"modifiers\": [\"evt\"], \"lines\": [{\"type\": \"comment\", \"text\": \"c\"}]},"
        + " {\"severity\": \"critical\", \"verb\": \"REPT\", \"modifiers\": [\"ALM\", \"EQPT\"], \"lines\":"
        + " [{\"type\": \"quoted\", \"text\": \"SLOT-1:CR\"}, {\"type\": \"plain\", \"text\": \"p\"}]}]"));
    assertEquals(2, control.sendMessages(DEVICE, messages));
    assertEquals(List.of("42 [REPT, REPT][EVT, ALM][null, EQPT][3, 0][[c], [SLOT-1:CR, p]][[2], [0, 1]]"), calls);
  }

  @Test
  void anAtagIsSetOnlyWhenAClientIsConnected() {
    assertFalse(control.setAtag(DEVICE, 100));
    clients = 1;
    assertTrue(control.setAtag(DEVICE, 100));
    assertEquals(List.of("atag 100 42"), calls, "the probe queues no message");
  }

  @Test
  void pendingEntriesAreReadFieldByField() {
    assertEquals(List.of(new PendingCommand(7, 180388626433L, 5, null, null, "ENT-X:NE1:A:1:ON=5;"),
        new PendingCommand(8, 180388626434L, null, "26-12-07", "01-30-00",
            "ED-EQPT::SLOT-5:2::DATE=26-12-07,TIME=01-30-00;")), control.pending(DEVICE));
  }
}
