package com.kestrelon.simulator.tessel;

import static org.junit.jupiter.api.Assertions.assertEquals;

import java.util.Optional;
import org.junit.jupiter.api.Test;

/** The open-file limit as /proc reports it, and the agents it leaves room for. */
class DescriptorBudgetTest {
  private static Optional<DescriptorBudget> parse(String soft, String hard) {
    return DescriptorBudget.parse(String.join("\n",
        "Limit                     Soft Limit           Hard Limit           Units     ",
        "Max open files            " + soft + "                " + hard + "                files     ",
        "Max locked memory         8388608              8388608              bytes     ", ""), 30);
  }

  @Test
  void readsTheOpenFileLimitsAndLeavesTheReserveOut() {
    assertEquals(Optional.of(new DescriptorBudget(20000, 40000, 30)), parse("20000", "40000"));
    assertEquals(Optional.of(new DescriptorBudget(1024, DescriptorBudget.UNLIMITED, 30)), parse("1024", "unlimited"));
    assertEquals(Optional.empty(), parse("many", "20000"));
    assertEquals(Optional.empty(), DescriptorBudget.parse("Max processes 10 10 processes\n", 5));

    assertEquals(0, new DescriptorBudget(100, 100, 100 - DescriptorBudget.RESERVE + 1).allowedAgents());
    assertEquals(Integer.MAX_VALUE,
        new DescriptorBudget(DescriptorBudget.UNLIMITED, DescriptorBudget.UNLIMITED, 46).allowedAgents());
    assertEquals(Integer.MAX_VALUE, new DescriptorBudget(1L << 40, 1L << 40, 46).allowedAgents());
  }
}
