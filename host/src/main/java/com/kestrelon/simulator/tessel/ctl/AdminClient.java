package com.kestrelon.simulator.tessel.ctl;

import com.google.gson.JsonElement;
import com.google.gson.JsonObject;
import com.google.gson.JsonParseException;
import com.google.gson.JsonParser;
import java.io.IOException;
import java.net.ConnectException;
import java.net.URI;
import java.net.http.HttpClient;
import java.net.http.HttpRequest;
import java.net.http.HttpResponse;
import java.net.http.HttpTimeoutException;
import java.nio.charset.StandardCharsets;
import java.time.Duration;
import java.util.Optional;

/**
 * Talks JSON to a running network's control interface. One request at a time; every answer is
 * parsed JSON, every failure one of two exceptions: the network answered with an error, or no
 * network answered at all.
 */
final class AdminClient {
  private static final Duration CONNECT_TIMEOUT = Duration.ofSeconds(3);
  private static final Duration REQUEST_TIMEOUT = Duration.ofSeconds(15);

  /** The network answered, with an error status or with something that is not JSON. */
  static final class ApiException extends Exception {
    private static final long serialVersionUID = 1L;

    ApiException(String message) {
      super(message);
    }
  }

  /** Nothing answered at the control address: refused, timed out or cut off. */
  static final class UnreachableException extends Exception {
    private static final long serialVersionUID = 1L;

    UnreachableException(String message) {
      super(message);
    }
  }

  private final String base;
  private final Optional<String> token;
  private final HttpClient http;

  /** A client for the control interface at {@code base} (such as {@code http://127.0.0.1:8161}). */
  AdminClient(String base, Optional<String> token) {
    this.base = base;
    this.token = token;
    this.http = HttpClient.newBuilder().connectTimeout(CONNECT_TIMEOUT).build();
  }

  /** GET of a path that may carry a query; the answer's JSON. */
  JsonElement get(String path) throws ApiException, UnreachableException {
    return send(request(path).GET().build());
  }

  /** POST of a path, with {@code body} as JSON, or with no body when it is empty. */
  JsonElement post(String path, Optional<JsonObject> body) throws ApiException, UnreachableException {
    return send("POST", path, body);
  }

  /** PUT of a path with {@code body} as JSON. */
  JsonElement put(String path, JsonObject body) throws ApiException, UnreachableException {
    return send("PUT", path, Optional.of(body));
  }

  /** DELETE of a path. */
  JsonElement delete(String path) throws ApiException, UnreachableException {
    return send("DELETE", path, Optional.empty());
  }

  private JsonElement send(String method, String path, Optional<JsonObject> body)
      throws ApiException, UnreachableException {
    HttpRequest.Builder request = request(path);
    if (body.isPresent()) {
      request.header("Content-Type", "application/json")
          .method(method, HttpRequest.BodyPublishers.ofString(body.get().toString(), StandardCharsets.UTF_8));
    } else {
      request.method(method, HttpRequest.BodyPublishers.noBody());
    }
    return send(request.build());
  }

  /**
   * {@code text} as one path segment or query value: everything but unreserved characters is
   * percent-encoded, so an address cannot reach another resource.
   */
  static String encode(String text) {
    StringBuilder encoded = new StringBuilder();
    for (byte b : text.getBytes(StandardCharsets.UTF_8)) {
      char c = (char) (b & 0xFF);
      if ((c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || "-._~".indexOf(c) >= 0) {
        encoded.append(c);
      } else {
        encoded.append('%').append(String.format("%02X", b & 0xFF));
      }
    }
    return encoded.toString();
  }

  private HttpRequest.Builder request(String path) {
    HttpRequest.Builder request = HttpRequest.newBuilder(URI.create(base + path))
        .timeout(REQUEST_TIMEOUT)
        .header("Accept", "application/json");
    token.ifPresent(secret -> request.header("Authorization", "Bearer " + secret));
    return request;
  }

  private JsonElement send(HttpRequest request) throws ApiException, UnreachableException {
    HttpResponse<String> response;
    try {
      response = http.send(request, HttpResponse.BodyHandlers.ofString(StandardCharsets.UTF_8));
    } catch (ConnectException e) {
      throw new UnreachableException("no network answers at " + base + ": connection refused");
    } catch (HttpTimeoutException e) {
      throw new UnreachableException("no network answers at " + base + ": timed out");
    } catch (IOException e) {
      throw new UnreachableException("no network answers at " + base + ": " + e);
    } catch (InterruptedException e) {
      Thread.currentThread().interrupt();
      throw new UnreachableException("interrupted while waiting for " + base);
    }
    Optional<JsonElement> json = parse(response.body());
    // The interface's refusals are {"error": ...}; one is an error whatever the status says.
    boolean refused = json.filter(JsonElement::isJsonObject).map(element -> element.getAsJsonObject().has("error"))
        .orElse(false);
    if (response.statusCode() >= 400 || refused) {
      throw new ApiException(errorMessage(response.statusCode(), json, response.body()));
    }
    return json.orElseThrow(() -> new ApiException(base + " answered " + request.uri().getPath()
        + " with something that is not JSON"));
  }

  private static String errorMessage(int status, Optional<JsonElement> json, String body) {
    Optional<String> error = json.filter(JsonElement::isJsonObject)
        .map(element -> element.getAsJsonObject().get("error"))
        .filter(element -> element != null && element.isJsonPrimitive())
        .map(JsonElement::getAsString);
    return error.orElse("HTTP " + status + (body.isBlank() ? "" : ": " + body.strip()));
  }

  private static Optional<JsonElement> parse(String body) {
    try {
      JsonElement element = JsonParser.parseString(body);
      return element.isJsonNull() ? Optional.empty() : Optional.of(element);
    } catch (JsonParseException e) {
      return Optional.empty();
    }
  }
}
