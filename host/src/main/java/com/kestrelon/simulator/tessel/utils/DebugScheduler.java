package com.kestrelon.simulator.tessel.utils;

import com.kestrelon.simulator.tessel.NativeLibrary;

/** Switches the engine's log file at run time. */
public class DebugScheduler {
  static {
    NativeLibrary.load();
  }

  public native void setDebugFile(String path);
}
