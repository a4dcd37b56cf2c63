package com.kestrelon.simulator.tessel;

import java.io.PrintStream;
import java.nio.charset.StandardCharsets;
import java.util.ArrayDeque;
import java.util.ArrayList;
import java.util.List;

/**
 * The engine's front door: initialisation, the base loop, the stop calls and the request filters.
 * The engine calls back {@link #getBytes} to read Java texts and {@link #printStatus} to report
 * status lines; both may be called from any thread. Status lines are written to the status
 * stream, each flushed as it is written, and the most recent ones (by default
 * {@value #KEPT_STATUS_LINES}) are kept for {@link #statusLines()}.
 */
public class NetworkSimulator {
  static {
    NativeLibrary.load();
  }

  private static final int KEPT_STATUS_LINES = 4096;

  private final ArrayDeque<String> statusLines = new ArrayDeque<>();
  private final PrintStream statusStream;
  private final int keptLines;

  /** Status lines go to standard output. */
  public NetworkSimulator() {
    this(System.out);
  }

  public NetworkSimulator(PrintStream statusStream) {
    this(statusStream, KEPT_STATUS_LINES);
  }

  /** Keeps the most recent {@code keptLines} status lines; with 0, {@link #statusLines()} is empty. */
  public NetworkSimulator(PrintStream statusStream, int keptLines) {
    if (keptLines < 0) {
      throw new IllegalArgumentException("keptLines " + keptLines);
    }
    this.statusStream = statusStream;
    this.keptLines = keptLines;
  }

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
    if (keptLines > 0) {
      synchronized (statusLines) {
        if (statusLines.size() == keptLines) {
          statusLines.removeFirst();
        }
        statusLines.addLast(line);
      }
    }
    synchronized (statusStream) {
      statusStream.println(line);
      statusStream.flush();
    }
  }

  /** The most recent status lines, oldest first. */
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
