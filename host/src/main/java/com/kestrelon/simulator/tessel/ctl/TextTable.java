package com.kestrelon.simulator.tessel.ctl;

import java.io.PrintWriter;
import java.util.ArrayList;
import java.util.List;

/** Rows of text in columns as wide as their widest cell, two spaces apart, for people to read. */
final class TextTable {
  private final List<List<String>> rows = new ArrayList<>();

  TextTable(List<String> headers) {
    rows.add(List.copyOf(headers));
  }

  TextTable row(List<String> cells) {
    rows.add(List.copyOf(cells));
    return this;
  }

  void print(PrintWriter out) {
    int columns = rows.stream().mapToInt(List::size).max().orElse(0);
    int[] widths = new int[columns];
    for (List<String> row : rows) {
      for (int i = 0; i < row.size(); i++) {
        widths[i] = Math.max(widths[i], row.get(i).length());
      }
    }
    for (List<String> row : rows) {
      StringBuilder line = new StringBuilder();
      for (int i = 0; i < row.size(); i++) {
        line.append(row.get(i));
        if (i + 1 < row.size()) {
          line.append(" ".repeat(widths[i] - row.get(i).length() + 2));
        }
      }
      out.println(line);
    }
  }
}
