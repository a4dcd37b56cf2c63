package com.kestrelon.simulator.tessel.data;

import java.util.List;

/**
 * One registration for the engine: a table or a scalar group, as {@link MibLayout} infers it.
 *
 * <ul>
 *   <li>{@code oid}: the OID text to register, without a leading dot. For a table its entry OID
 *       ({@code T.1}); for a scalar group the OID of its first scalar without the trailing
 *       {@code .0} ({@code P.k}; the engine takes {@code P} from it).</li>
 *   <li>{@code subIds}: the columns of a table or the scalar sub-identifiers {@code k} of a group,
 *       ascending, as decimal texts.</li>
 *   <li>{@code dataTypes}: per sub-identifier, the BER type number of its objects, as decimal text.</li>
 *   <li>{@code accessTexts}: per sub-identifier, the access code text ({@value MibLayout#READ_WRITE}).</li>
 *   <li>{@code rowStatusColumn}: 0, no row status column.</li>
 * </ul>
 * Immutable.
 */
public record CellDefinition(String label, boolean isTable, String oid, List<String> subIds,
                             List<String> dataTypes, List<String> accessTexts, int rowStatusColumn) {
    public CellDefinition {
        subIds = List.copyOf(subIds);
        dataTypes = List.copyOf(dataTypes);
        accessTexts = List.copyOf(accessTexts);
        if (subIds.isEmpty() || subIds.size() != dataTypes.size() || subIds.size() != accessTexts.size()) {
            throw new IllegalArgumentException("a cell needs one type and one access text per sub-identifier");
        }
    }

    /** The registered OID: the table's entry, or the group's first scalar without {@code .0}. */
    public Oid registeredOid() {
        return Oid.parse(oid);
    }
}
