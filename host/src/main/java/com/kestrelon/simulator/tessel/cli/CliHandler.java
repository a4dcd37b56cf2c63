package com.kestrelon.simulator.tessel.cli;

import com.kestrelon.simulator.tessel.NativeLibrary;
import java.util.IdentityHashMap;
import java.util.Map;
import java.util.Optional;
import java.util.concurrent.ConcurrentHashMap;

/**
 * The CLI side of the host: the engine's CLI service (its natives) and the meaning of every line a
 * CLI session types (the methods the engine calls). The engine does the transport, the login and
 * the enable dialogues, the line editing and the prompts; the host says what each line prints,
 * which mode it leads to, which block it enters and how it changes the device's configuration.
 *
 * <p>The engine calls the host methods from several of its threads at once. Each device is found
 * by its address (the agent's second host text; the first is its group); a line is answered with
 * key/value pairs applied in order: "response" (text, with "\n" line ends), "level" (the new
 * mode), "context" (the block the session is now in) and "devicename" (the device's new name,
 * shown in every prompt of the device at once). A device that is not served answers null.
 */
public class CliHandler {
  static {
    NativeLibrary.load();
  }

  private final Map<String, CliDevice> devices = new ConcurrentHashMap<>();
  private final Map<CliData, CliMatcher> matchers = new IdentityHashMap<>();

  /** Caches the JVM, this object and its host methods in the engine; false when a method is missing. */
  public native boolean jniJVMParams();

  /** Starts the engine's CLI service (again: nothing); true when it runs. */
  public native boolean initCliThread();

  public native boolean initCliVectorThread();

  /**
   * Registers one CLI agent, replacing one at the same address and port; 1, or 0 when refused. A
   * non-empty enable password makes {@code enable} ask for it.
   */
  public native int nativePassCliAgentInfo(String userName, String password, String enablePassword,
      String ipAddress, int port, String hostText1, String hostText2, String hostText3, String hostText4,
      String deviceName, int hostNumber, int hostInt);

  /** Opens the Telnet listeners of registered agents; per agent 1 started, 0 failed. */
  public native int[] startCliNetwork(String[] ipAddresses, int[] ports, int telnetServerFlag, int hostInt1,
      int hostInt2);

  public native boolean startCliAgent(String ipAddress, int port, int telnetServerFlag, int hostInt1, int hostInt2);

  /** Closes an agent's listeners (Telnet and SSH) and sessions and forgets it. */
  public native boolean stopCLIAgent(String ipAddress, int port, int telnetServerFlag);

  public native void setCliLoginPrompt(String prompt);

  public native void setCliPasswordPrompt(String prompt);

  /** The prompt of user EXEC; "$DEVICENAME" at its start stands for the device's name. */
  public native void setCliPromptString(String prompt);

  public native void changeCliPromptString(String prompt);

  /** Reads the added modes and their prompts from conf/IosModes.prop and conf/IosPrompts.prop. */
  public native void setUserAddedModesAndNames();

  /** With false, SSH listeners are refused. */
  public native void setSSHStatus(boolean enabled);

  /** The folder the SSH host keys are kept in (generated there once when missing). */
  public native void setSSHKeyPath(String directory);

  /** Opens SSH on sshPort for the agent registered at ipAddress and cliPort. */
  public native boolean startSshListener(String ipAddress, int sshPort, int cliPort);

  /** {sessions open, logins since the start, commands answered since the start}. */
  public native long[] cliCounters();

  /** Serves the device at {@code address} (again: from its data's configuration, named {@code name}). */
  public void addDevice(String address, CliData data, String name) {
    CliMatcher matcher;
    synchronized (matchers) {
      matcher = matchers.computeIfAbsent(data, CliMatcher::new);
    }
    devices.put(address, new CliDevice(address, data, matcher, name));
  }

  /**
   * Brings the device back to its startup configuration, as a router reloads; the name it then
   * has, empty when it is not served.
   */
  public Optional<String> reload(String address) {
    return Optional.ofNullable(devices.get(address)).map(CliDevice::reload);
  }

  /** The device's running configuration as {@code show running-config} lists it; empty when not served. */
  public Optional<String> runningConfig(String address) {
    return Optional.ofNullable(devices.get(address)).map(CliDevice::runningConfig);
  }

  public String[] enterResponseMethod(String line, int mode, String hostText1, String hostText2, String hostText3,
      String hostText4, String ipAddress, int port) {
    return enterContextResponseMethod(line, mode, hostText1, hostText2, hostText3, hostText4, ipAddress, port, "");
  }

  /** The reply to a line typed in {@code mode} by a session inside the block {@code context}. */
  public String[] enterContextResponseMethod(String line, int mode, String hostText1, String hostText2,
      String hostText3, String hostText4, String ipAddress, int port, String context) {
    CliDevice device = device(hostText2, ipAddress);
    return device == null ? null : device.enter(line, mode, context);
  }

  /** The {@code ?} help for the line typed so far. */
  public String questionResponseMethod(String line, int mode, String hostText1, String hostText2) {
    CliDevice device = device(hostText2, null);
    return device == null ? null : device.help(line, mode);
  }

  /** The line typed so far with its last word completed. */
  public String tabResponseMethod(String line, int mode, String hostText1, String hostText2) {
    CliDevice device = device(hostText2, null);
    return device == null ? line : device.complete(line, mode);
  }

  private CliDevice device(String address, String fallback) {
    CliDevice device = address == null ? null : devices.get(address);
    return device != null || fallback == null ? device : devices.get(fallback);
  }
}
