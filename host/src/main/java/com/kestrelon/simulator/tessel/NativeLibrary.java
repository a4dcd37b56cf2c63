package com.kestrelon.simulator.tessel;

/**
 * Loads the engine library once per class loader: from the path in the system property
 * {@code tessel.library} when it is set, else by name from java.library.path.
 */
public final class NativeLibrary {
  private static boolean loaded;

  private NativeLibrary() {}

  public static synchronized void load() {
    if (loaded) {
      return;
    }
    String path = System.getProperty("tessel.library");
    if (path != null && !path.isEmpty()) {
      System.load(path);
    } else {
      System.loadLibrary("tessel");
    }
    loaded = true;
  }
}
