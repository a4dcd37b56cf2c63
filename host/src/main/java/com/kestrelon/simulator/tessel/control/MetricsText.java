package com.kestrelon.simulator.tessel.control;

import java.util.EnumMap;
import java.util.List;
import java.util.Locale;
import java.util.Map;

/** The network's state in the Prometheus text exposition format, version 0.0.4. */
final class MetricsText {
  static final String CONTENT_TYPE = "text/plain; version=0.0.4; charset=utf-8";

  /** The metric name of each engine counter, in {@link EngineReports#COUNTER_NAMES} order. */
  static final List<String> COUNTER_METRICS =
      EngineReports.COUNTER_NAMES.stream().map(MetricsText::counterMetric).toList();

  private MetricsText() {}

  static String render(long[] counters, double requestsPerSecond, Tl1Control.Counters tl1, CliControl.Counters cli,
      Map<String, Map<String, EnumMap<AgentState, Integer>>> devices) {
    StringBuilder text = new StringBuilder();
    for (int i = 0; i < COUNTER_METRICS.size(); i++) {
      String metric = COUNTER_METRICS.get(i);
      text.append("# HELP ").append(metric).append(" The engine's ")
          .append(EngineReports.COUNTER_NAMES.get(i)).append(" counter.\n");
      text.append("# TYPE ").append(metric).append(" counter\n");
      text.append(metric).append(' ').append(counters[i]).append('\n');
    }
    text.append("# HELP tessel_snmp_requests_per_second SNMP messages received per second over the last 10 s.\n");
    text.append("# TYPE tessel_snmp_requests_per_second gauge\n");
    text.append("tessel_snmp_requests_per_second ").append(String.format(Locale.ROOT, "%.3f", requestsPerSecond))
        .append('\n');
    metric(text, "tessel_tl1_sessions", "gauge", "TL1 sessions open now.", tl1.sessions());
    metric(text, "tessel_tl1_commands_total", "counter", "TL1 commands answered.", tl1.commands());
    metric(text, "tessel_cli_sessions", "gauge", "CLI sessions open now (Telnet and SSH).", cli.sessions());
    metric(text, "tessel_cli_logins_total", "counter", "CLI logins that succeeded.", cli.logins());
    metric(text, "tessel_cli_commands_total", "counter", "CLI commands answered.", cli.commands());
    text.append("# HELP tessel_devices Devices per group and protocol whose agent is in the state.\n");
    text.append("# TYPE tessel_devices gauge\n");
    devices.forEach((group, protocols) -> protocols.forEach((protocol, states) -> states.forEach(
        (state, count) -> text.append("tessel_devices{group=\"").append(labelValue(group))
            .append("\",protocol=\"").append(labelValue(protocol))
            .append("\",state=\"").append(state.text()).append("\"} ").append(count).append('\n'))));
    return text.toString();
  }

  /** One metric without labels: its help, its type and its value. */
  private static void metric(StringBuilder text, String name, String type, String help, long value) {
    text.append("# HELP ").append(name).append(' ').append(help).append('\n');
    text.append("# TYPE ").append(name).append(' ').append(type).append('\n');
    text.append(name).append(' ').append(value).append('\n');
  }

  /**
   * snmpInPkts becomes tessel_snmp_in_pkts_total: the counter's own "snmp" prefix is dropped (the
   * metric carries it already) and each capitalised word, or run of capitals such as ASN, becomes
   * a lower-case word.
   */
  static String counterMetric(String counter) {
    String name = counter.startsWith("snmp") ? counter.substring("snmp".length()) : counter;
    StringBuilder snake = new StringBuilder();
    for (int i = 0; i < name.length(); i++) {
      char c = name.charAt(i);
      boolean wordStart = Character.isUpperCase(c) && i > 0
          && (!Character.isUpperCase(name.charAt(i - 1))
              || (i + 1 < name.length() && Character.isLowerCase(name.charAt(i + 1))));
      if (wordStart) {
        snake.append('_');
      }
      snake.append(Character.toLowerCase(c));
    }
    return "tessel_snmp_" + snake + "_total";
  }

  /** A label value with backslash, double quote and line feed escaped. */
  static String labelValue(String value) {
    return value.replace("\\", "\\\\").replace("\"", "\\\"").replace("\n", "\\n");
  }
}
