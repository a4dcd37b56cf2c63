package com.kestrelon.simulator.tessel.snmp;

import com.kestrelon.simulator.tessel.NativeLibrary;

/** Registers scalar groups and tables in the engine's MIB tree. */
public class SnmpRegister {
  static {
    NativeLibrary.load();
  }

  public native boolean JniCreateTreeCell(String label, String unused, String version, String oid,
      int count, String[] subIds, String[] dataTypes, String[] access, boolean isTable,
      int rowStatusColumn, String[] syntaxes);

  public native boolean isAlreadyRegistered(String oid);
}
