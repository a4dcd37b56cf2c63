package com.kestrelon.simulator.tessel.tl1;

import com.kestrelon.simulator.tessel.NativeLibrary;

/**
 * TL1 agents in the engine: their registration, their listeners (raw TCP, and Telnet for people
 * at a terminal), the command codes they answer, login, keep-alive, the commands waiting for
 * delayed activation and the service's counters. An agent is named by the agent id the host gives
 * it; a session id is the agent id shifted left by 32 bits with the session's running number.
 */
public class TL1Register {
  static {
    NativeLibrary.load();
  }

  /**
   * Registers and opens a batch of agents; the arrays hold one element per agent. Answers one
   * element per agent: 1 started, 0 failed, -1 out of memory.
   */
  public native int[] startTL1Network(int[] agentIds, String[] agentTexts, String[] ipAddresses, int[] ports,
      String networkText, String[] sids, int[] agentNumbers);

  /** Registers one agent without opening it; answers its agent id. */
  public native int nativePassOneAgentInfo(String networkText, String agentText, String modeText,
      String ipAddress, int port, String sid, int agentId, int agentNumber);

  /** Adds a command code the agents answer (case-insensitive); false when it is known already. */
  public native boolean registerTL1Commands(String commandCode);

  /** Opens the listener of a registered agent. */
  public native boolean startAgent(String ipAddress, int port, int agentNumber);

  /** Closes an agent's sessions and listeners and forgets it. */
  public native boolean stopAgent(String ipAddress, int port);

  /** Runs the engine's base loop on the calling thread until the network stops. */
  public native boolean nativeBaseLoop();

  /** The texts the agent was registered with, '|'-joined; null for no such agent. */
  public native String GetTL1ModeInfo(String ipAddress, String port);

  /** The agent id of the agent at that address and port. */
  public native int GetTL1ServerSessionID(String ipAddress, String port);

  /** The keep-alive, in seconds (0 never), of the listeners opened from now on; answers it. */
  public native int KeepAliveTimeForTL1Agent(int seconds);

  /**
   * With {@code required}, a session of the agent must log in with ACT-USER before any other
   * command, which is otherwise answered DENY PLNA.
   */
  public native void setLoginRequired(int agentId, boolean required);

  /** Opens a Telnet listener for a started agent, served with line editing and completion. */
  public native boolean startTelnetListener(String ipAddress, int port, int agentId);

  /**
   * The agent's commands waiting for delayed activation, one per element, fields joined by TAB:
   * id, session, ON, date or "", time or "", the command as received.
   */
  public native String[] listPending(int agentId);

  /** Runs a waiting command now on its session; false when there is none with that id. */
  public native boolean runPending(int agentId, int id);

  /** Drops a waiting command; false when there is none with that id. */
  public native boolean cancelPending(int agentId, int id);

  /** {sessions open, commands answered} over all agents. */
  public native long[] tl1Counters();
}
