package com.kestrelon.simulator.tessel.control;

/** Sends a notification from a device now, and says whether it left and, for an inform, its ID. */
public interface NotificationSender {
  /** Why a notification was or was not sent, in the order the engine numbers its outcomes. */
  enum Result {
    SENT("sent"),
    BAD_ARRAYS("the bindings' OIDs, types and values differ in number"),
    BAD_BINDING("the engine could not convert an OID or a value"),
    UNRESOLVED("the manager's host name does not resolve"),
    NO_DEVICE("the device is not running"),
    NO_FORM("the notification has no form for the manager's SNMP version, or does not fit in a message"),
    REFUSED("refused by SNMPv3: an unknown user or context, or the user's notify view excludes the "
        + "notification or one of its bindings"),
    NOT_SENT("the device's socket did not send it");

    private final String reason;

    Result(String reason) {
      this.reason = reason;
    }

    public String reason() {
      return reason;
    }

    /** The result the engine numbers {@code code}; null for a number it does not use. */
    static Result ofCode(int code) {
      return code >= 0 && code < values().length ? values()[code] : null;
    }
  }

  /** @param engineInformId the engine's ID of a sent inform, as its reports name it; 0 for a trap */
  record Outcome(Result result, int engineInformId) {}

  Outcome send(Device device, Notification notification);
}
