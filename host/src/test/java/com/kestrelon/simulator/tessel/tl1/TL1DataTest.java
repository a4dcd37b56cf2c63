package com.kestrelon.simulator.tessel.tl1;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.kestrelon.simulator.tessel.data.DeviceDataException;
import com.kestrelon.simulator.tessel.tl1.TL1Data.Block;
import com.kestrelon.simulator.tessel.tl1.TL1Data.Line;
import com.kestrelon.simulator.tessel.tl1.TL1Data.LineType;
import java.nio.file.Path;
import java.util.List;
import java.util.Optional;
import java.util.stream.Stream;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

/** TL1 data files: what a block holds, which block answers a command, and that faults name their line. */
class TL1DataTest {
  private static final String GOOD = """
      # an element
      [RTRV-ALM]
      COMPLD
      "{AID}:CR,LOS,SA"\r
      /*{SID} alarms*/
      ALARMS # OF {SID}

      [rtrv-alm-env]\r
      ack pf\r
      RTRV\r
      [RTRV-EQPT]
      COMPLD
      [RTRV-EQPT slot-2]
      DENY IENE
      [RTRV]
      ack NG
      PRTL
      ""
      """;

  @Test
  void blocksHoldTheirAckCompletionAndLinesByType() throws Exception {
    TL1Data data = TL1Data.parse("good.tl1", GOOD);
    assertEquals(List.of("RTRV-ALM", "RTRV-ALM-ENV", "RTRV-EQPT", "RTRV"), data.codes());
    assertEquals(Optional.of(new Block("RTRV-ALM", null, 0, 1, null, List.of(new Line(LineType.QUOTED, "{AID}:CR,LOS,SA"),
        new Line(LineType.COMMENT, "{SID} alarms"), new Line(LineType.PLAIN, "ALARMS # OF {SID}")), 2)),
        data.find("RTRV", "ALM", null, null));
    assertEquals(Optional.of(new Block("RTRV-ALM-ENV", null, 2, 5, null, List.of(), 8)),
        data.find("RTRV", "ALM", "ENV", "X"));
    assertEquals(Optional.of(new Block("RTRV-EQPT", "slot-2", 0, 2, "IENE", List.of(), 13)),
        data.find("RTRV", "EQPT", null, "SLOT-2"));
    assertEquals(List.of(new Line(LineType.QUOTED, "")), data.find("RTRV", null, null, null).get().lines());
  }

  @Test
  void commandsFallBackToTheGenericCodeAndTheBlockForEveryAid() throws Exception {
    TL1Data data = TL1Data.parse("good.tl1", GOOD);
    assertEquals("RTRV-ALM", data.find("RTRV", "ALM", "ALL", "SLOT-1").get().code());
    assertEquals("RTRV-ALM-ENV", data.find("rtrv", "alm", "env", null).get().code());
    assertEquals("RTRV", data.find("RTRV", "INV", null, null).get().code());
    assertEquals(null, data.find("RTRV", "EQPT", null, "SLOT-3").get().aid());
    assertEquals(null, data.find("RTRV", "EQPT", null, null).get().aid());
    assertEquals(Optional.empty(), data.find("ENT", "EQPT", null, "SLOT-2"));
    TL1Data aidOnly = TL1Data.parse("aid.tl1", "[DLT-EQPT SLOT-1]\nCOMPLD\n");
    assertEquals(Optional.empty(), aidOnly.find("DLT", "EQPT", null, "SLOT-2"));
    assertEquals(Optional.empty(), aidOnly.find("DLT", "EQPT", null, null));
  }

  @ParameterizedTest(name = "{1}")
  @CsvSource(delimiter = ';', value = {
      "[RTRV-ALM\\nCOMPLD;                       1: the block header [RTRV-ALM is not closed",
      "# x\\n[1RTRV]\\nCOMPLD;                   2: '1RTRV' is not a command code",
      "[RTRV-ALM-ALL-X]\\nCOMPLD;                1: 'RTRV-ALM-ALL-X' is not a command code",
      "[RTRV-ALM A B]\\nCOMPLD;                  1: a block header takes [CODE] or [CODE AID]",
      "[]\\nCOMPLD;                              1: a block header takes [CODE] or [CODE AID]",
      "[RTRV-HDR]\\n\\nack XX\\nCOMPLD;          3: unknown ack code 'XX' (IP, PF, NA, RL, OK, NG)",
      "[RTRV-HDR]\\nCOMPLETED;                   2: unknown completion code 'COMPLETED'",
      "[RTRV-HDR]\\nCOMPLD NOW;                  2: unknown completion code 'COMPLD NOW'",
      "[RTRV-HDR]\\nack IP\\nack OK\\nCOMPLD;    3: unknown completion code 'ack OK'",
      "[RTRV-HDR]\\nDENY ABCD;                   2: DENY takes one code of the error table",
      "[RTRV-HDR]\\nDENY;                        2: DENY takes one code of the error table",
      "# x\\n\\nCOMPLD\\n[RTRV-HDR]\\nCOMPLD;     3: a response line outside a block",
      "[RTRV-HDR]\\nCOMPLD\\n[RTRV-ALM]\\n# x;    3: the block [RTRV-ALM] has no completion line",
      "[RTRV-HDR]\\nack IP\\n[RTRV-ALM]\\nCOMPLD; 1: the block [RTRV-HDR] has no completion line",
      "[RTRV-EQPT S-1]\\nCOMPLD\\n[rtrv-eqpt s-1]\\nCOMPLD; 3: a second block [rtrv-eqpt s-1] (the first is on line 1)"})
  void eachFaultNamesItsLine(String text, String expected) {
    DeviceDataException fault = assertThrows(DeviceDataException.class,
        () -> TL1Data.parse("bad.tl1", text.replace("\\n", "\n")));
    assertTrue(fault.getMessage().startsWith("bad.tl1:" + expected), fault.getMessage());
  }

  @Test
  void errorCodesKeepTheEnginesNumbers() {
    assertEquals(List.of(1, 51, 72, 87, 105, 168, 175, 176, 0), Stream.of("EANS", "IIAC", "PLNA", "SAAS", "SCNF",
        "SWLD", "PIUI", "AIDT", "iiac").map(TL1Codes::errorNumber).toList());
    assertEquals("INVALID DATE TIME", TL1Codes.errorText(176));
  }

  @Test
  void shippedOpticalElementAnswersItsCommands() throws Exception {
    Path profiles = Path.of(System.getProperty("tessel.profiles.dir", "profiles"));
    TL1Data optical = TL1Data.load(profiles.resolve("optical.tl1"));
    assertTrue(optical.codes().containsAll(List.of("RTRV-HDR", "RTRV-ALM", "RTRV-EQPT", "RTRV-INV", "ENT-EQPT",
        "DLT-EQPT", "ED-EQPT", "ACT-USER", "CANC-USER", "RTRV-PM", "RTRV-COND", "RTRV-CRS")), optical.codes().toString());
    assertEquals("RTRV-ALM", optical.find("RTRV", "ALM", "ALL", null).get().code());
    assertEquals("IENE", optical.find("RTRV", "EQPT", null, "SLOT-16").get().deny());
    assertEquals(1, optical.find("ENT", "EQPT", null, "SLOT-3").get().ack());
  }
}
