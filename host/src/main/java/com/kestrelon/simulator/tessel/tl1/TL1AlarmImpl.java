package com.kestrelon.simulator.tessel.tl1;

import com.kestrelon.simulator.tessel.NativeLibrary;

/**
 * Autonomous messages (alarms and events) from a TL1 agent to its connected sessions. An alarm
 * code is 0 critical ("*C"), 1 major ("**"), 2 minor ("* ") or 3 non-alarm ("A "); queued messages
 * leave in that order. A line type is 0 quoted, 1 plain or 2 comment.
 */
public class TL1AlarmImpl {
  static {
    NativeLibrary.load();
  }

  /** Sends one message to every session of the agent; nothing when none is connected. */
  public native void SendAutonomousMessage(String verb, String modifier1, String modifier2, byte alarmCode,
      String[] lines, int[] lineTypes, int agentId);

  /** The ATAG the agent's next autonomous message carries. */
  public native void SetAtagValue(int atag, int agentId);

  /**
   * Queues several messages at once, element i of each array making message i, so that their
   * alarm order holds among them; answers the number of sessions reached, 0 when none is
   * connected (then nothing is queued).
   */
  public native int sendAutonomousBatch(String[] verbs, String[] modifiers1, String[] modifiers2,
      byte[] alarmCodes, String[][] lines, int[][] lineTypes, int agentId);
}
