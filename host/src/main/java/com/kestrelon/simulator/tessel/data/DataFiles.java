package com.kestrelon.simulator.tessel.data;

import java.io.IOException;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.NoSuchFileException;
import java.nio.file.Path;

/** Reads a data file as UTF-8 text, its faults named as the file is written. */
public final class DataFiles {
  private DataFiles() {}

  public static String read(Path file) throws DeviceDataException {
    try {
      return new String(Files.readAllBytes(file), StandardCharsets.UTF_8);
    } catch (NoSuchFileException e) {
      throw new DeviceDataException(file.toString(), 1, "no such file");
    } catch (IOException e) {
      throw new DeviceDataException(file.toString(), 1, "cannot be read: " + e.getMessage());
    }
  }
}
