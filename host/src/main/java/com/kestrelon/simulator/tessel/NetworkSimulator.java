package com.kestrelon.simulator.tessel;

import java.nio.charset.StandardCharsets;
import java.util.ArrayList;
import java.util.List;

/**
 * The engine's front door: initialisation, the base loop, the stop calls and the request filters.
 * The engine calls back {@link #getBytes} to read Java texts and {@link #printStatus} to report
 * status lines; both may be called from any thread.
 */
public class NetworkSimulator {
  static {
    NativeLibrary.load();
  }

  private final List<String> statusLines = new ArrayList<>();

  public native boolean nativeInitAgentParams(
      boolean consoleMode, byte debugLevel, String logFile, int reserved, int maxLogFileSize);

  public native boolean jniBaseLoop();

  public native boolean AdapterJniStopSnmp();

  public native boolean AdapterJniStopNetwork();

  public native void dropV1V2Requests(short flag);

  public native void processV1RequestsOnly(short flag);

  public native void processV2RequestsOnly(short flag);

  public native void scramblePdu(int flag);

  public native int jniGetEngineBootCounts();

  public native int GetIPv6InterfaceIndex();

  public native int GetTL1AgentID();

  /** The UTF-8 bytes of a text, as the engine reads every Java text. */
  public byte[] getBytes(String text) {
    return text == null ? null : text.getBytes(StandardCharsets.UTF_8);
  }

  public void printStatus(String line) {
    synchronized (statusLines) {
      statusLines.add(line);
    }
    System.out.println(line);
  }

  /** The status lines reported so far, oldest first. */
  public List<String> statusLines() {
    synchronized (statusLines) {
      return new ArrayList<>(statusLines);
    }
  }

  public void clearStatusLines() {
    synchronized (statusLines) {
      statusLines.clear();
    }
  }
}
