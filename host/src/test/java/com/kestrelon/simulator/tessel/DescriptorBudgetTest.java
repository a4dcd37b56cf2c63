package com.kestrelon.simulator.tessel;

import static org.junit.jupiter.api.Assertions.assertEquals;

import java.util.Optional;
import org.junit.jupiter.api.Test;

/** The open-file limit as /proc reports it, and the agents it leaves room for. */
class DescriptorBudgetTest {
  private static final String LIMITS = String.join("\n",
      "Limit                     Soft Limit           Hard Limit           Units     ",
      "Max file size             unlimited            unlimited            bytes     ",
      "Max open files            %s                %s                files     ",
      "Max locked memory         8388608              8388608              bytes     ", "");

  private static Optional<DescriptorBudget> parse(String soft, String hard, long open) {
    return DescriptorBudget.parse(String.format(LIMITS, soft, hard), open);
  }

  @Test
  void readsTheSoftAndHardOpenFileLimits() {
    assertEquals(Optional.of(new DescriptorBudget(20000, 40000, 30)), parse("20000", "40000", 30));
    assertEquals(Optional.of(new DescriptorBudget(1024, DescriptorBudget.UNLIMITED, 5)),
        parse("1024", "unlimited", 5));
    assertEquals(Optional.empty(), DescriptorBudget.parse("Max processes 10 10 processes\n", 5));
    assertEquals(Optional.empty(), parse("many", "20000", 5));
  }

  @Test
  void agentsGetWhatTheOpenDescriptorsAndTheReserveLeave() {
    int reserve = DescriptorBudget.RESERVE;
    assertEquals(20000 - 46 - reserve, new DescriptorBudget(20000, 20000, 46).allowedAgents());
    assertEquals(0, new DescriptorBudget(100, 100, 100 - reserve + 1).allowedAgents());
    assertEquals(Integer.MAX_VALUE,
        new DescriptorBudget(DescriptorBudget.UNLIMITED, DescriptorBudget.UNLIMITED, 46).allowedAgents());
    assertEquals(Integer.MAX_VALUE, new DescriptorBudget(1L << 40, 1L << 40, 46).allowedAgents());
  }
}
