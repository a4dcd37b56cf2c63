package com.kestrelon.simulator.tessel.network;

/** A fault in a network file; the message reads {@code FILE:LINE: reason}. */
public final class NetworkFileException extends Exception {
  private static final long serialVersionUID = 1L;

  public NetworkFileException(String file, int line, String reason) {
    super(file + ":" + line + ": " + reason);
  }
}
