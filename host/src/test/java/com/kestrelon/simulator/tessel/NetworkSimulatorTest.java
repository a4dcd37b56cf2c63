package com.kestrelon.simulator.tessel;

import static org.junit.jupiter.api.Assertions.assertEquals;

import java.io.ByteArrayOutputStream;
import java.io.PrintStream;
import java.nio.charset.StandardCharsets;
import java.util.List;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

/** Status lines: every one reaches the status stream; only the most recent few are kept. */
class NetworkSimulatorTest {
  @ParameterizedTest
  @CsvSource({"0, ''", "2, 'b c'", "5, 'a b c'"})
  void statusLinesAreWrittenAndTheMostRecentKept(int kept, String expected) {
    ByteArrayOutputStream stream = new ByteArrayOutputStream();
    NetworkSimulator simulator = new NetworkSimulator(new PrintStream(stream, false, StandardCharsets.UTF_8), kept);
    List.of("a", "b", "c").forEach(simulator::printStatus);
    assertEquals("a\nb\nc\n", stream.toString(StandardCharsets.UTF_8), "each line is flushed");
    assertEquals(expected.isEmpty() ? List.of() : List.of(expected.split(" ")), simulator.statusLines());
  }
}
