package com.kestrelon.simulator.nqx;

import com.kestrelon.simulator.tessel.NativeLibrary;

/** The engine's SNMP statistics and the log of requests answered with an error. */
public class ReportsUI {
  static {
    NativeLibrary.load();
  }

  /** The 28 statistics counters. */
  public native int[] getReportOverviewDetails();

  /** Four integers per logged request (id, version, PDU type, error status), then the count. */
  public native int[] getErrorLogs();

  /** The manager addresses of the first n entries of the last getErrorLogs call. */
  public native String[] getIpAddrArr(int n);
}
