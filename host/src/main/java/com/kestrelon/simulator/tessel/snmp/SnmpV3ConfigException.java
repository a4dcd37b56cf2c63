package com.kestrelon.simulator.tessel.snmp;

/** A fault in an SNMPv3 configuration file; the message reads {@code FILE:LINE: reason}. */
public final class SnmpV3ConfigException extends Exception {
  private static final long serialVersionUID = 1L;

  public SnmpV3ConfigException(String file, int line, String reason) {
    super(file + ":" + line + ": " + reason);
  }
}
