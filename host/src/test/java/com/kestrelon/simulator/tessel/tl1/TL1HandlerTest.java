package com.kestrelon.simulator.tessel.tl1;

import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertNull;

import java.time.Clock;
import java.time.Instant;
import java.time.ZoneOffset;
import java.util.List;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Test;

/** The answers the engine gets from the host for each command. */
class TL1HandlerTest {
  private static final String DATA = """
      [RTRV-ALM]
      COMPLD
      "{AID}:CR,LOS,{DATE},{TIME},{P1}|{P2}|{P3}"
      /*{SID} alarms for {CTAG}*/
      ALARMS OF {SID} {X} {P10}
      [RTRV-ALM SLOT-2]
      RTRV
      "only {AID}"
      [ENT-EQPT]
      ack IP
      DELAY
      [DLT-EQPT]
      ack NG
      DENY SNVS
      [DLT-EQPT SLOT-1]
      DENY IIAC
      /*in use*/
      [ACT-USER]
      COMPLD
      /*hello {AID} {P1}*/
      """;
  private static final int AGENT = 7;

  private final TL1Handler handler =
      new TL1Handler(Clock.fixed(Instant.parse("2024-06-30T14:05:09Z"), ZoneOffset.UTC));

  @BeforeEach
  void serveOneDevice() throws Exception {
    handler.addDevice(AGENT, "NE1", "optical", TL1Data.parse("t.tl1", DATA), List.of(new TL1User("admin", "s3cret")));
  }

  private String[] respond(String verb, String modifier1, String modifier2, String aid, String... parameters) {
    return handler.getResponseBlock(verb, modifier1, modifier2, aid, parameters, AGENT, 0, "127.0.1.1", 3083,
        null, null, "", null);
  }

  private int ack(String verb, String modifier1, String aid) {
    return handler.getAck(verb, modifier1, null, aid, null, AGENT, 0, null, null, "", null);
  }

  @Test
  void responseLinesCarryTheirTypeAndReplacedPlaceholders() {
    assertArrayEquals(new String[] {"1", "0|OC192-5-1:CR,LOS,24-06-30,14:05:09,a|b c|",
        "2|NE1 alarms for {CTAG}", "1|ALARMS OF NE1 {X} {P10}"}, respond("RTRV", "ALM", "ALL", "OC192-5-1", "a", "b c"));
    assertArrayEquals(new String[] {"1", "0|:CR,LOS,24-06-30,14:05:09,{SID}||", "2|NE1 alarms for {CTAG}",
        "1|ALARMS OF NE1 {X} {P10}"}, respond("RTRV", "ALM", null, null, "{SID}", null));
    assertArrayEquals(new String[] {"5", "0|only slot-2"}, respond("RTRV", "ALM", null, "slot-2"));
    assertArrayEquals(new String[] {"4"}, respond("ENT", "EQPT", null, "SLOT-3"));
  }

  @Test
  void denyAnswersTheErrorCodeWithItsTextAndTheBlocksOwnLines() {
    assertArrayEquals(new String[] {"ErrorCode", "SNVS", "NOT IN VALID STATE"}, respond("DLT", "EQPT", null, "SLOT-2"));
    assertArrayEquals(new String[] {"2", "1|IIAC", "0|INVALID ACCESS IDENTIFIER", "2|in use"},
        respond("DLT", "EQPT", null, "SLOT-1"));
    assertArrayEquals(new String[] {"ErrorCode", "SCNF", "COMMAND NOT FOUND"}, respond("RTRV", "EQPT", null, null));
  }

  @Test
  void acknowledgmentsComeFromTheBlockThatAnswers() {
    assertEquals(1, ack("ENT", "EQPT", "SLOT-3"));
    assertEquals(6, ack("DLT", "EQPT", "SLOT-2"));
    assertEquals(0, ack("DLT", "EQPT", "SLOT-1"));
    assertEquals(0, ack("RTRV", "ALM", null));
    assertEquals(0, ack("RTRV", "EQPT", null));
    assertEquals(0, handler.getAck("ENT", "EQPT", null, null, null, AGENT + 1, 0, null, null, "", null));
  }

  @Test
  void loginChecksTheUsersAndKeepsThePasswordOutOfTheAnswer() throws Exception {
    assertArrayEquals(new String[] {"1", "2|hello admin "}, respond("ACT", "USER", null, "admin", "s3cret"));
    String[] refused = {"ErrorCode", "PIUI", "PRIVILEGE, ILLEGAL USER IDENTITY"};
    assertArrayEquals(refused, respond("ACT", "USER", null, "admin", "wrong"));
    assertArrayEquals(refused, respond("ACT", "USER", null, "root", "s3cret"));
    assertArrayEquals(refused, respond("ACT", "USER", null, "admin"));
    assertArrayEquals(new String[] {"1"}, respond("CANC", "USER", null, "admin"));
    handler.addDevice(AGENT, "NE1", "optical", TL1Data.parse("e.tl1", ""), List.of());
    assertArrayEquals(new String[] {"1"}, respond("ACT", "USER", null, "anyone", "x"));
  }

  @Test
  void devicesAreServedOnlyWhileRegisteredAndTheirCodesAreRegisteredOnce() throws Exception {
    handler.addDevice(AGENT + 1, "NE2", "optical", TL1Data.parse("o.tl1", "[RTRV-HDR]\nCOMPLD\n[RTRV-ALM]\nCOMPLD\n"),
        List.of());
    assertEquals(List.of("RTRV-ALM", "ENT-EQPT", "DLT-EQPT", "ACT-USER", "RTRV-HDR", "CANC-USER"),
        handler.commandCodes());
    handler.removeDevice(AGENT);
    assertNull(respond("RTRV", "ALM", null, null));
    assertEquals(List.of("RTRV-HDR", "RTRV-ALM", "ACT-USER", "CANC-USER"), handler.commandCodes());
  }
}
