package com.kestrelon.simulator.tessel.snmp;

import com.kestrelon.simulator.tessel.NativeLibrary;

/** Looks registered agents up by address. */
public class GetModeInfoImpl {
  static {
    NativeLibrary.load();
  }

  /** "database:table" of the agent on address and port, or null. */
  public native String GetModeInfo(String address, String port);

  /** The agent id of the agent on address, -1 when there is none. */
  public native int GetAgentID(String address, String port);
}
