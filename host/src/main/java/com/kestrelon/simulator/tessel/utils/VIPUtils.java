package com.kestrelon.simulator.tessel.utils;

import com.kestrelon.simulator.tessel.NativeLibrary;

/**
 * Puts device addresses on the host's interfaces and takes them off again. Statuses per address: 1
 * added (or removed), -2 already there, -3 no such interface, 87 invalid address, mask or interface
 * name, -5 no usable interface, 0 any other failure. The engine removes only what it added.
 */
public class VIPUtils {
  static {
    NativeLibrary.load();
  }

  public native int addVirtualIP(String address, int isIPv6, String subnetMask);

  public native void deleteVirtualIP(String address, int isIPv6);

  public native int deleteAllVirtualIPs();

  public native int[] addVirtualIpsForWindows(String[] addresses, int[] isIPv6, String subnetMask);

  public native int[] deleteVirtualIpsForWindows(String[] addresses, int[] isIPv6);

  /** Added addresses report the address base (at least 100), the others their failure status. */
  public native int[] addVirtualIpsForLinuxSolaris(
      String[] addresses, String interfaceName, int[] isIPv6, String ignored, int solaris);

  public native int[] deleteVirtualIpsForLinuxSolaris(
      String[] countOnly,
      String interfaceName,
      String[] addresses,
      int[] isIPv6,
      String ignored,
      int solaris);

  public native int SetInterfaceVector(String[] interfaceNames);
}
