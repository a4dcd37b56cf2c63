package com.kestrelon.simulator.tessel.control;

import java.util.ArrayDeque;
import java.util.concurrent.TimeUnit;
import java.util.function.LongSupplier;

/**
 * Requests per second over the last ten seconds, from the engine's incoming packet counter.
 * Sampled only when someone asks, so an idle network spends nothing on it: the rate runs from the
 * newest sample at least ten seconds old (or the oldest one, early on) to now. Thread-safe.
 */
public final class RequestRate {
  static final long WINDOW_NANOS = TimeUnit.SECONDS.toNanos(10);
  /** Samples closer than this to the newest one are not kept, which bounds the history. */
  private static final long SPACING_NANOS = WINDOW_NANOS / 100;

  private record Sample(long nanos, long count) {}

  private final LongSupplier clock;
  private final ArrayDeque<Sample> samples = new ArrayDeque<>();

  public RequestRate() {
    this(System::nanoTime);
  }

  /** A rate that reads the time in nanoseconds from {@code clock}. */
  RequestRate(LongSupplier clock) {
    this.clock = clock;
  }

  /**
   * Takes the counter's current value (an unsigned 32-bit count that wraps) and answers the rate
   * up to now; 0 until two samples lie apart in time.
   */
  public synchronized double sample(long count) {
    long now = clock.getAsLong();
    Sample newest = samples.peekLast();
    if (newest == null || now - newest.nanos >= SPACING_NANOS) {
      samples.addLast(new Sample(now, count));
    }
    // Drop the oldest sample once the next one is old enough to serve as the start itself.
    while (samples.size() > 1 && now - second().nanos >= WINDOW_NANOS) {
      samples.removeFirst();
    }
    Sample start = samples.peekFirst();
    long elapsed = now - start.nanos;
    if (elapsed <= 0) {
      return 0;
    }
    long requests = (count - start.count) & 0xFFFF_FFFFL;
    return requests * 1e9 / elapsed;
  }

  private Sample second() {
    var iterator = samples.iterator();
    iterator.next();
    return iterator.next();
  }
}
