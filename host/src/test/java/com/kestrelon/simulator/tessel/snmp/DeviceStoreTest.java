package com.kestrelon.simulator.tessel.snmp;

import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertNull;

import com.kestrelon.simulator.tessel.data.DeviceData;
import java.util.ArrayList;
import java.util.List;
import java.util.stream.IntStream;
import org.junit.jupiter.api.Test;

/** The value methods as the engine calls them, served from recorded data. */
class DeviceStoreTest {
  private static final String SYSTEM = ".1.3.6.1.2.1.1";
  private static final String ENTRY = ".1.3.6.1.2.1.4.20.1";

  /** Objects out of order; an address table whose instances are four sub-identifiers each. */
  private static final String DATA = String.join("\n",
      "1.3.6.1.2.1.4.20.1.2.192.168.1.1|2|3",
      "1.3.6.1.2.1.4.20.1.1.192.168.1.1|64|192.168.1.1",
      "1.3.6.1.2.1.4.20.1.1.10.0.0.1|64|10.0.0.1",
      "1.3.6.1.2.1.4.20.1.1.9.255.0.1|64|9.255.0.1",
      "1.3.6.1.2.1.4.20.1.2.10.0.0.1|2|1",
      "1.3.6.1.2.1.4.20.1.1.4294967295.0.0.1|64|1.2.3.4",
      "1.3.6.1.2.1.1.5.0|4|edge",
      "1.3.6.1.2.1.1.2.0|6|1.3.6.1.4.1.8072");

  private final SnmpHandler handler;

  DeviceStoreTest() throws Exception {
    handler = new SnmpHandler(new DeviceStore(DeviceData.parse("test.snmprec", DATA)));
  }

  private String[] get(int agent, String subId) {
    return handler.ScalarGetOidVal("cell1", SYSTEM, subId, ".0", "db", "t", 4, agent, 0, "127.0.0.1", 161, null);
  }

  private String[] set(int agent, String subId, String value) {
    return handler.SetOidVal("cell1", SYSTEM, subId, ".0", "db", "t", value, 4, agent, 0, "127.0.0.1", 160, null);
  }

  private String[] next(int agent, int column, String instance) {
    return handler.TableGetNextOidVal("cell2", ENTRY, instance, column, column + 1, 64, 2, "db", "t", agent, 0,
        "127.0.0.1", 161, null);
  }

  private String[] setCell(int agent, String column, String instance, String value) {
    return handler.TableSetOidVal("cell2", ENTRY, column, instance, "db", "t", value, null, null, null, null, null,
        null, 2, agent, 0, "127.0.0.1", 160, null);
  }

  /** The instances a walk of one column visits (10 at most), following the answers from the column's start. */
  private List<String> walkColumn(int agent, int column) {
    List<String> visited = new ArrayList<>();
    String instance = null;
    for (String[] answer = next(agent, column, null); answer != null && visited.size() < 10;
        answer = next(agent, column, instance)) {
      visited.add(answer[1] + "=" + answer[0]);
      instance = answer[1].substring(answer[1].indexOf('.'));
    }
    return visited;
  }

  @Test
  void answersEngineTextsAndNothingForUnknownObjects() {
    assertArrayEquals(new String[] {"'65646765'h", "-1"}, get(0, "5"));
    assertArrayEquals(get(0, "5"), handler.ScalarGetNextOidVal("cell1", SYSTEM, "5", ".0", "4", "db", "t", 4, 0, 0,
        "127.0.0.1", 161, null), "a scalar GetNext answers the object it names");
    assertNull(get(0, "6"));
    assertArrayEquals(new String[] {"3", "-1"}, handler.TableGetOidVal("cell2", ENTRY, "2", ".192.168.1.1", "db",
        "t", 2, 0, 0, "127.0.0.1", 161, null));
    assertNull(handler.TableGetOidVal("cell2", ENTRY, "2", ".192.168.1", "db", "t", 2, 0, 0, "127.0.0.1", 161, null));
    assertNull(handler.TableGetOidVal("cell2", ENTRY, "2", null, "db", "t", 2, 0, 0, "127.0.0.1", 161, null));
  }

  @Test
  void tableGetNextWalksOneColumnInNumericOrder() {
    assertEquals(List.of("1.9.255.0.1=9.255.0.1", "1.10.0.0.1=10.0.0.1", "1.192.168.1.1=192.168.1.1",
        "1.4294967295.0.0.1=1.2.3.4"), walkColumn(0, 1));
    assertEquals(List.of("2.10.0.0.1=1", "2.192.168.1.1=3"), walkColumn(0, 2));
    assertEquals("1.10.0.0.1", next(0, 1, ".10")[1], "a partial instance precedes its completions");
    assertEquals("1.192.168.1.1", next(0, 1, ".11.0.0.0.7")[1], "an instance between two recorded ones");
    assertNull(next(0, 2, ".192.168.1.1"), "the column is exhausted: the next column is not answered");
    assertNull(next(0, 3, null), "a column without objects");
    assertNull(handler.TableGetNextOidVal("x", ".1.3.6.1.9.1", null, 1, 2, 2, 2, "db", "t", 0, 0, "a", 1, null));
    assertNull(next(0, 1, ".1..2"), "a malformed instance");
    assertNull(next(0, 1, "10.0.0.1"), "an instance without its leading dot");
    assertNull(next(0, 1, ".4294967296"), "a sub-identifier beyond 32 bits");
  }

  @Test
  void aSetChangesOnlyItsOwnAgentAndARefusedOneNothing() {
    assertArrayEquals(new String[] {"'74657374'h", "-1"}, set(1, "5", "test"));
    assertArrayEquals(new String[] {"'74657374'h", "-1"}, get(1, "5"));
    assertArrayEquals(new String[] {"'65646765'h", "-1"}, get(2, "5"), "other devices keep the recorded value");
    assertArrayEquals(new String[] {"7", "-1"}, setCell(3, "2", ".10.0.0.1", "7"));
    assertEquals(List.of("2.10.0.0.1=7", "2.192.168.1.1=3"), walkColumn(3, 2));

    assertEquals("17", set(1, "9", "x")[1], "no such object: notWritable");
    assertEquals("17", setCell(1, "2", ".1.1.1.1", "5")[1]);
    assertEquals("17", setCell(1, "2", null, "5")[1]);
    assertEquals("10", set(1, "2", ".1")[1], "not an OID value: wrongValue");
    assertEquals("10", setCell(1, "2", ".10.0.0.1", "x")[1]);
    assertArrayEquals(new String[] {".1.3.6.1.4.1.8072", "-1"}, get(1, "2"));
    assertEquals(List.of("2.10.0.0.1=1", "2.192.168.1.1=3"), walkColumn(1, 2));
  }

  @Test
  void concurrentFirstSetsOfManyAgentsAreAllKept() throws Exception {
    // An agent's own values are created on its first Set, by many request threads at once.
    String oid = ENTRY + ".2.10.0.0.1";
    int threads = 4;
    int agents = 50_000;
    for (int round = 0; round < 5; round++) {
      DeviceStore store = new DeviceStore(DeviceData.parse("test.snmprec", DATA));
      List<Thread> setters = IntStream.range(0, threads).mapToObj(first -> new Thread(() -> {
        for (int agent = first; agent < agents; agent += threads) {
          store.set(agent, oid, Integer.toString(agent));
        }
      })).toList();
      setters.forEach(Thread::start);
      for (Thread setter : setters) {
        setter.join(30_000);
      }
      for (int agent = 0; agent < agents; agent++) {
        assertEquals(Integer.toString(agent), store.get(agent, oid), "agent " + agent);
      }
    }
  }
}
