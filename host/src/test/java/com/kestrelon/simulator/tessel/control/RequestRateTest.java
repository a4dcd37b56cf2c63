package com.kestrelon.simulator.tessel.control;

import static org.junit.jupiter.api.Assertions.assertEquals;

import java.util.concurrent.TimeUnit;
import java.util.concurrent.atomic.AtomicLong;
import org.junit.jupiter.api.Test;

class RequestRateTest {
  @Test
  void theRateSpansTheLastTenSecondsAcrossACounterWrap() {
    AtomicLong now = new AtomicLong(TimeUnit.HOURS.toNanos(5));
    RequestRate rate = new RequestRate(now::get);
    assertEquals(0.0, rate.sample(4_294_967_290L));
    now.addAndGet(TimeUnit.SECONDS.toNanos(5));
    // 16 requests, the counter wrapping through zero.
    assertEquals(3.2, rate.sample(10), 1e-9);
    now.addAndGet(TimeUnit.SECONDS.toNanos(15));
    // The first sample is out of the window now: nothing arrived in the 15 s since the second.
    assertEquals(0.0, rate.sample(10), 1e-9);
    now.addAndGet(TimeUnit.SECONDS.toNanos(2));
    // The window starts at the newest sample at least 10 s old: 6 requests in 17 s.
    assertEquals(6 / 17.0, rate.sample(16), 1e-9);
  }
}
