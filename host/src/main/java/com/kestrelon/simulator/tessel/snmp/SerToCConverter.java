package com.kestrelon.simulator.tessel.snmp;

import com.kestrelon.simulator.tessel.NativeLibrary;

/**
 * Hands the SNMPv3 configuration to the engine: USM users, VACM contexts, groups, access rows and
 * view families. Each add returns 1 when the row was added, 0 when it was refused, 99 when the
 * engine ran out of memory. Access rows and view families take part in decisions once {@link
 * #nativeCreateLCDVectors} has run after them.
 */
public class SerToCConverter {
  static {
    NativeLibrary.load();
  }

  /**
   * Protocols: NO_AUTH, MD5_AUTH, SHA_AUTH and NO_PRIV, CBC_DES, CFB_AES_128. The discovery-time
   * flag makes Reports carry the agent's boots and time.
   */
  public native int nativeAddUsmUserEntry(
      String userName,
      String authProtocol,
      String authPassword,
      String privProtocol,
      String privPassword,
      int discoveryTimeFlag);

  public native int nativeAddContextEntry(String contextName);

  public native int nativeAddSecurityToGroupEntry(
      int securityModel, String securityName, String groupName, int unused, int storageType);

  /** Levels 0, 1, 3; match 1 exact, 2 prefix. */
  public native int nativeAddAccessEntry(
      String groupName,
      String contextPrefix,
      int securityModel,
      int securityLevel,
      int contextMatch,
      String readView,
      String writeView,
      String notifyView,
      int storageType,
      int unused);

  /** Subtree dotted; mask hexadecimal (empty: all ones); type 1 included, 2 excluded. */
  public native int nativeAddViewTreeEntry(
      String viewName, String subtree, String mask, int type, int storageType, int unused);

  public native void nativeCreateLCDVectors();
}
