package com.kestrelon.simulator.tessel.tl1;

/** A user that ACT-USER accepts. Its text form leaves the password out, so logs never show it. */
public record TL1User(String user, String password) {
  @Override
  public String toString() {
    return "TL1User[user=" + user + "]";
  }
}
