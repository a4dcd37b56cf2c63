package com.kestrelon.simulator.tessel.data;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertThrows;

import java.nio.file.Path;
import java.util.ArrayList;
import java.util.List;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.ValueSource;

class MibLayoutTest {

    /** A corpus file: from -Dtessel.data.dir, else from the source tree. */
    static DeviceData corpus(String name) throws Exception {
        return DeviceData.load(Path.of(System.getProperty("tessel.data.dir", "host/src/test/resources/data"), name));
    }

    /**
     * The OIDs a GetNext walk over the registered cells answers, the host serving values from the
     * data: cells in order of their registered OIDs; a scalar group answers P.k.0 for each of its
     * k; a table answers column by column each column's instances in order. Also checks that each
     * answered object has the type registered for its sub-identifier.
     */
    static List<Oid> walk(List<CellDefinition> cells, DeviceData data) {
        List<CellDefinition> ordered = new ArrayList<>(cells);
        ordered.sort((a, b) -> a.registeredOid().compareTo(b.registeredOid()));
        List<Oid> answered = new ArrayList<>();
        for (CellDefinition cell : ordered) {
            Oid registered = cell.registeredOid();
            for (int i = 0; i < cell.subIds().size(); i++) {
                long subId = Long.parseLong(cell.subIds().get(i));
                String type = cell.dataTypes().get(i);
                Oid scalar = registered.prefix(registered.length() - 1).append(subId, 0);
                List<DeviceObject> objects = data.objects().stream().filter(o -> cell.isTable()
                        ? o.oid().startsWith(registered.append(subId)) && o.oid().length() > registered.length() + 1
                        : o.oid().equals(scalar)).toList();
                for (DeviceObject object : objects) {
                    assertEquals(type, String.valueOf(object.typeNumber()), "type of " + object.oid());
                    answered.add(object.oid());
                }
            }
        }
        return answered;
    }

    private static String describe(List<CellDefinition> cells) {
        StringBuilder text = new StringBuilder();
        for (CellDefinition cell : cells) {
            text.append(cell.isTable() ? "table " : "scalars ").append(cell.oid()).append(' ')
                    .append(String.join(",", cell.subIds())).append('\n');
        }
        return text.toString();
    }

    @ParameterizedTest
    @ValueSource(strings = {"linux-host.walk", "branch-router.snmprec"})
    void servingTheLayoutAnswersExactlyTheRecordedObjectsInOrder(String name) throws Exception {
        DeviceData data = corpus(name);
        assertEquals(data.objects().stream().map(DeviceObject::oid).toList(), walk(MibLayout.infer(data), data));
    }

    @Test
    void doesNotTakeWholeGroupsForTables() throws Exception {
        // Seen from mgmt, system and interfaces look like two columns with shared instances 1.0;
        // seen from 32474, the two tables of group 32474.1 look like two columns of one table.
        // A lone object makes a one-column table under the entry that ends in 1.
        DeviceData data = DeviceData.parse("d", String.join("\n",
                "1.3.6.1.2.1.1.1.0|4|router", "1.3.6.1.2.1.1.4.0|4|noc", "1.3.6.1.2.1.1.5.0|4|r1",
                "1.3.6.1.2.1.2.1.0|2|2", "1.3.6.1.4.1.32473.1.1.0|2|1", "1.3.6.1.4.1.32473.1.2.0|2|1",
                "1.3.6.1.4.1.32474.1.1.1.2.1|65|1", "1.3.6.1.4.1.32474.1.1.1.2.2|65|2",
                "1.3.6.1.4.1.32474.1.1.1.3.1|65|3", "1.3.6.1.4.1.32474.1.1.1.3.2|65|4",
                "1.3.6.1.4.1.32474.1.2.1.2.7|65|5", "1.3.6.1.4.1.32474.1.2.1.3.7|65|6",
                "1.3.6.1.4.1.32475.1.1.2.7.3|2|1"));
        assertEquals("""
                scalars 1.3.6.1.2.1.1.1 1,4,5
                scalars 1.3.6.1.2.1.2.1 1
                scalars 1.3.6.1.4.1.32473.1.1 1,2
                table 1.3.6.1.4.1.32474.1.1.1 2,3
                table 1.3.6.1.4.1.32474.1.2.1 2,3
                table 1.3.6.1.4.1.32475.1.1 2
                """, describe(MibLayout.infer(data)));
    }

    @Test
    void refusesAnObjectNoCellCanServe() throws Exception {
        DeviceData data = DeviceData.parse("d", "1.3.6.1.4.1.32473.1.0|2|1\n1.3.6.1.4.1.32473.1.0.5|4|x\n");
        var error = assertThrows(DeviceDataException.class, () -> MibLayout.infer(data));
        assertEquals("d:2: object 1.3.6.1.4.1.32473.1.0.5 fits neither a table nor a scalar group:"
                + " its sub-tree is shared with other cells", error.getMessage());
    }
}
