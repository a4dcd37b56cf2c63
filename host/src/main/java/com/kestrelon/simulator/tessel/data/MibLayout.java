package com.kestrelon.simulator.tessel.data;

import java.util.ArrayList;
import java.util.Collections;
import java.util.Comparator;
import java.util.HashSet;
import java.util.List;
import java.util.Set;

/**
 * Infers, without a MIB, which recorded objects form tables and which form scalar groups, so that
 * serving the registered cells answers exactly the recorded objects, in OID order.
 *
 * <ol>
 *   <li><b>Tables.</b> A prefix T is a table when every object under T reads {@code T.1.c.inst}
 *       with a non-empty instance, there are at least two columns c, each column's objects share
 *       one type, every column's instances are among those of the column with the most, and not all
 *       of those read {@code 0} or {@code k.0} (that is a scalar group, or groups of scalars one
 *       level down, such as the system and interfaces groups seen from mgmt). The shortest such T
 *       wins; nothing under it is looked at again. Whole groups such as mib-2, whose sub-trees
 *       reuse the same suffixes, fail these tests.</li>
 *   <li><b>Leftovers.</b> Each object outside the tables that is not of the form {@code P.k.0}
 *       becomes part of a table with entry E, where the object reads {@code E.c.inst}: among the
 *       prefixes E that work, the longest ending in sub-identifier 1 (the usual entry), else the
 *       longest. E works when every object under E is outside the tables found so far, reads
 *       {@code E.c.inst} with a non-empty instance, and each column c has one type. All objects
 *       under E join that table, {@code .0} objects included (an ifStackTable walk, one column
 *       with instances such as {@code 0.1} and {@code 1.0}, becomes one table this way).</li>
 *   <li><b>Scalars.</b> The remaining {@code P.k.0} objects are scalars. Each run of scalars with
 *       the same P that follow one another in OID order with no other object between them is one
 *       scalar group: a group registered across a table would make a walk skip the table.</li>
 * </ol>
 * An object that fits none of these raises a {@link DeviceDataException} at its line. Every cell
 * gets {@value #READ_WRITE} (read-write) access and no row status column. Stateless; safe from
 * any thread.
 */
public final class MibLayout {
    /** The access text given for every sub-identifier: read-write. */
    public static final String READ_WRITE = "43706";

    private final DeviceData data;
    private final List<DeviceObject> objects;
    private final boolean[] placed;
    private final List<Cell> cells = new ArrayList<>();

    /** A cell under construction: registered OID, sub-ids with their types. */
    private record Cell(boolean isTable, Oid oid, List<Long> subIds, List<BerType> types) {
    }

    private MibLayout(DeviceData data) {
        this.data = data;
        this.objects = data.objects();
        this.placed = new boolean[objects.size()];
    }

    /** The cells serving {@code data}, in OID order of their registered OIDs, labelled cell1, cell2, .... */
    public static List<CellDefinition> infer(DeviceData data) throws DeviceDataException {
        MibLayout layout = new MibLayout(data);
        layout.findTables(0, layout.objects.size(), 0);
        layout.placeLeftovers();
        layout.groupScalars();
        return layout.definitions();
    }

    // ---- tables -------------------------------------------------------------------------------

    /** Looks for tables among objects [lo, hi), which share their first {@code depth} sub-identifiers. */
    private void findTables(int lo, int hi, int depth) {
        if (depth >= 1 && addTableIfValid(lo, hi, depth)) {
            return;
        }
        int i = lo;
        while (i < hi && oid(i).length() == depth) {
            i++;
        }
        while (i < hi) {
            long sub = oid(i).get(depth);
            int j = i + 1;
            while (j < hi && oid(j).get(depth) == sub) {
                j++;
            }
            findTables(i, j, depth + 1);
            i = j;
        }
    }

    private boolean addTableIfValid(int lo, int hi, int depth) {
        for (int i = lo; i < hi; i++) {
            if (oid(i).length() < depth + 3 || oid(i).get(depth) != 1) {
                return false;
            }
        }
        List<Column> columns = columns(lo, hi, depth + 1);
        if (columns == null || columns.size() < 2) {
            return false;
        }
        Column largest = Collections.max(columns, Comparator.comparingInt(c -> c.instances.size()));
        if (largest.instances.stream().allMatch(MibLayout::isScalarLeaf)) {
            return false;
        }
        for (Column column : columns) {
            if (!largest.instances.containsAll(column.instances)) {
                return false;
            }
        }
        addTable(oid(lo).prefix(depth + 1), columns, lo, hi);
        return true;
    }

    /** True for the instances {@code 0} and {@code k.0}: scalars of a group at T.1.c or one level below. */
    private static boolean isScalarLeaf(String instance) {
        return instance.equals("0") || instance.matches("[0-9]+\\.0");
    }

    /** A column: its sub-identifier, its objects' type and their instance texts. */
    private record Column(long subId, BerType type, Set<String> instances) {
    }

    /**
     * The columns of objects [lo, hi) under an entry of {@code entryLength} sub-identifiers, or
     * null when a column mixes types or an object has no instance.
     */
    private List<Column> columns(int lo, int hi, int entryLength) {
        List<Column> columns = new ArrayList<>();
        Column current = null;
        for (int i = lo; i < hi; i++) {
            Oid oid = oid(i);
            if (oid.length() < entryLength + 2) {
                return null;
            }
            long subId = oid.get(entryLength);
            BerType type = objects.get(i).type();
            if (current == null || current.subId != subId) {
                current = new Column(subId, type, new HashSet<>());
                columns.add(current);
            } else if (current.type != type) {
                return null;
            }
            current.instances.add(oid.suffixText(entryLength + 1));
        }
        return columns;
    }

    private void addTable(Oid entry, List<Column> columns, int lo, int hi) {
        for (int i = lo; i < hi; i++) {
            placed[i] = true;
        }
        cells.add(new Cell(true, entry, columns.stream().map(Column::subId).toList(),
                columns.stream().map(Column::type).toList()));
    }

    // ---- leftovers ----------------------------------------------------------------------------

    private static boolean mayBeScalar(Oid oid) {
        return oid.length() >= 3 && oid.last() == 0;
    }

    private void placeLeftovers() throws DeviceDataException {
        for (int i = 0; i < objects.size(); i++) {
            if (placed[i] || mayBeScalar(oid(i))) {
                continue;
            }
            if (!placeInEntry(oid(i), true) && !placeInEntry(oid(i), false)) {
                throw new DeviceDataException(data.source(), objects.get(i).line(), "object " + oid(i)
                        + " fits neither a table nor a scalar group: its sub-tree is shared with other cells");
            }
        }
    }

    /** Tries the entries for {@code oid}, longest first (only those ending in 1 when asked). */
    private boolean placeInEntry(Oid oid, boolean entryEndsInOne) {
        for (int length = oid.length() - 2; length >= 1; length--) {
            Oid entry = oid.prefix(length);
            if (entryEndsInOne && entry.last() != 1) {
                continue;
            }
            int lo = data.position(entry);
            int hi = lo;
            boolean free = true;
            while (hi < objects.size() && oid(hi).startsWith(entry)) {
                free &= !placed[hi];
                hi++;
            }
            if (!free) {
                return false; // every shorter entry holds the same placed object
            }
            List<Column> columns = columns(lo, hi, length);
            if (columns != null) {
                addTable(entry, columns, lo, hi);
                return true;
            }
        }
        return false;
    }

    // ---- scalars ------------------------------------------------------------------------------

    private void groupScalars() {
        Oid runParent = null;
        List<Long> subIds = null;
        List<BerType> types = null;
        for (int i = 0; i < objects.size(); i++) {
            if (placed[i]) {
                runParent = null;
                continue;
            }
            Oid oid = oid(i);
            Oid parent = oid.prefix(oid.length() - 2);
            if (!parent.equals(runParent)) {
                runParent = parent;
                subIds = new ArrayList<>();
                types = new ArrayList<>();
                cells.add(new Cell(false, oid.prefix(oid.length() - 1), subIds, types));
            }
            subIds.add(oid.get(oid.length() - 2));
            types.add(objects.get(i).type());
            placed[i] = true;
        }
    }

    private List<CellDefinition> definitions() {
        cells.sort(Comparator.comparing(Cell::oid));
        List<CellDefinition> definitions = new ArrayList<>();
        for (Cell cell : cells) {
            List<String> access = Collections.nCopies(cell.subIds.size(), READ_WRITE);
            definitions.add(new CellDefinition("cell" + (definitions.size() + 1), cell.isTable, cell.oid.toString(),
                    cell.subIds.stream().map(String::valueOf).toList(),
                    cell.types.stream().map(t -> String.valueOf(t.number())).toList(), access, 0));
        }
        return definitions;
    }

    private Oid oid(int index) {
        return objects.get(index).oid();
    }
}
