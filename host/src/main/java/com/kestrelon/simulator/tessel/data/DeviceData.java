package com.kestrelon.simulator.tessel.data;

import java.io.IOException;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.Collections;
import java.util.Comparator;
import java.util.List;
import java.util.Map;
import java.util.TreeMap;

/**
 * The recorded objects of one device, sorted by OID, each OID once.
 *
 * <p>Loads {@code .snmprec} files ({@code OID|TAG|VALUE} lines) and {@code snmpwalk -On} output;
 * the format is told from the content, never from the file name. Values are held as engine
 * texts (see {@link ValueText}). Faults in the data raise a {@link DeviceDataException} naming
 * the file and line. Immutable and thread-safe.
 */
public final class DeviceData {
    private final String source;
    private final List<DeviceObject> objects;
    private final Oid[] oids;

    private DeviceData(String source, List<DeviceObject> sorted) {
        this.source = source;
        this.objects = Collections.unmodifiableList(sorted);
        this.oids = sorted.stream().map(DeviceObject::oid).toArray(Oid[]::new);
    }

    /** Reads and parses a data file; errors name the file as {@code file.toString()}. */
    public static DeviceData load(Path file) throws IOException, DeviceDataException {
        return parse(file.toString(), Files.readAllBytes(file));
    }

    /**
     * Parses the bytes of a data file. String values keep their octets exactly as written; the
     * file's text is not re-encoded.
     *
     * @param source the name errors and {@link #source()} give for the data
     */
    public static DeviceData parse(String source, byte[] content) throws DeviceDataException {
        List<String> lines = splitLines(new String(content, StandardCharsets.ISO_8859_1));
        List<DeviceObject> parsed = switch (DataFormat.detect(source, lines)) {
            case SNMPREC -> SnmprecParser.parse(source, lines);
            case SNMPWALK -> SnmpwalkParser.parse(source, lines);
        };
        return of(source, parsed);
    }

    /** Parses data given as text (encoded as UTF-8 first). */
    public static DeviceData parse(String source, String content) throws DeviceDataException {
        return parse(source, content.getBytes(StandardCharsets.UTF_8));
    }

    /** Sorts objects into OID order; a second object with the same OID is a fault at its line. */
    static DeviceData of(String source, List<DeviceObject> objects) throws DeviceDataException {
        if (objects.isEmpty()) {
            throw new DeviceDataException(source, 1, "no objects in the data");
        }
        List<DeviceObject> sorted = new ArrayList<>(objects);
        sorted.sort(Comparator.comparing(DeviceObject::oid).thenComparingInt(DeviceObject::line));
        for (int i = 1; i < sorted.size(); i++) {
            DeviceObject first = sorted.get(i - 1);
            DeviceObject second = sorted.get(i);
            if (first.oid().equals(second.oid())) {
                throw new DeviceDataException(source, second.line(),
                        "duplicate OID " + second.oid() + " (first on line " + first.line() + ")");
            }
        }
        return new DeviceData(source, sorted);
    }

    /**
     * The objects of several data sets in one, for a MIB layout that serves them all: where two
     * hold the same OID, the earlier set's object is kept.
     */
    public static DeviceData union(List<DeviceData> sets) {
        if (sets.size() == 1) {
            return sets.get(0);
        }
        Map<Oid, DeviceObject> objects = new TreeMap<>();
        for (DeviceData set : sets) {
            set.objects.forEach(object -> objects.putIfAbsent(object.oid(), object));
        }
        return new DeviceData("the union of " + sets.size() + " data sets", new ArrayList<>(objects.values()));
    }

    /**
     * The lines of the text, split at LF with a CR before it dropped. A CR elsewhere is an octet
     * of a value (net-snmp prints such strings as they are), so unlike {@link String#lines()} this
     * does not end a line there.
     */
    private static List<String> splitLines(String text) {
        List<String> lines = new ArrayList<>(Arrays.asList(text.split("\n", -1)));
        if (!lines.isEmpty() && lines.get(lines.size() - 1).isEmpty()) {
            lines.remove(lines.size() - 1);
        }
        lines.replaceAll(line -> line.endsWith("\r") ? line.substring(0, line.length() - 1) : line);
        return lines;
    }

    /** The name the data was loaded under. */
    public String source() {
        return source;
    }

    /** All objects in OID order (unmodifiable). */
    public List<DeviceObject> objects() {
        return objects;
    }

    /** The position of the first object whose OID is not before {@code oid}; the count when none is. */
    int position(Oid oid) {
        int index = Arrays.binarySearch(oids, oid);
        return index >= 0 ? index : -index - 1;
    }
}
