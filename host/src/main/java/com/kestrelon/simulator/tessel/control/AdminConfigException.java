package com.kestrelon.simulator.tessel.control;

/** The control interface cannot start as configured; the message says why, for the user. */
public final class AdminConfigException extends Exception {
  private static final long serialVersionUID = 1L;

  public AdminConfigException(String message) {
    super(message);
  }
}
