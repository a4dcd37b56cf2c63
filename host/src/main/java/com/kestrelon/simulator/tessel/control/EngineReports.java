package com.kestrelon.simulator.tessel.control;

import java.util.List;

/** What the engine reports about the SNMP requests it served. */
public interface EngineReports {
  /** The names of the engine's statistics counters, in the order {@link #counters()} gives them. */
  List<String> COUNTER_NAMES = List.of(
      "snmpInPkts", "snmpOutPkts",
      "snmpInGetRequests", "snmpInGetNexts", "snmpInSetRequests", "snmpInGetBulks",
      "v1GetRequests", "v1GetNexts", "v1SetRequests",
      "v2cGetRequests", "v2cGetNexts", "v2cGetBulks", "v2cSetRequests",
      "v3GetRequests", "v3GetNexts", "v3GetBulks", "v3SetRequests",
      "v1Requests", "v2cRequests", "v3Requests",
      "snmpOutTraps", "droppedRequests", "snmpInASNParseErrs", "snmpInBadVersions",
      "snmpInBadCommunityNames", "v3SecurityErrors", "snmpOutGetResponses", "droppedTraps");

  /** The counters now, one per name of {@link #COUNTER_NAMES}, as unsigned 32-bit values. */
  long[] counters();

  /** The most recent requests answered with an error, oldest first (at most 100). */
  List<RequestError> errors();

  /**
   * A request the engine answered with an error.
   *
   * @param manager the address the request came from
   * @param version {@code v1}, {@code v2c} or {@code v3}
   * @param pdu the request's PDU type: {@code get}, {@code getNext}, {@code set}, {@code getBulk}
   * @param errorStatus the error-status of the answer (2 is noSuchName, ...)
   */
  record RequestError(String manager, long requestId, String version, String pdu, int errorStatus) {}
}
