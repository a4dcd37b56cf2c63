package com.kestrelon.simulator.tessel.control;

import java.util.Locale;

/** What one protocol's agent of a device is doing. */
public enum AgentState {
  RUNNING,
  STOPPED,
  /** The agent could not open its socket; it serves nothing until a start succeeds. */
  FAILED;

  /** The lower-case word the control interface uses. */
  public String text() {
    return name().toLowerCase(Locale.ROOT);
  }

  /** The state a word names, or null for any other word. */
  public static AgentState ofText(String text) {
    for (AgentState state : values()) {
      if (state.text().equals(text)) {
        return state;
      }
    }
    return null;
  }
}
