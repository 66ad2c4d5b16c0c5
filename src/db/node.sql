-- SPDX-License-Identifier: Apache-2.0
--
-- The node database, /usr/ovra/etc/ovradr/node.db (mode 0600), schema version 1. `ovradr setup`
-- applies this file to an empty database in one transaction; no other program creates a table
-- there.
--
-- The credential tables keep their rowid: rows of one node are returned in insertion order, and the
-- first one is used first.

CREATE TABLE ovradrcore_db_info (
    id INTEGER PRIMARY KEY CHECK (id = 1),
    version INTEGER NOT NULL
);
INSERT INTO ovradrcore_db_info (id, version) VALUES (1, 1);

-- What this node uses to reach other nodes.
CREATE TABLE node_cred (
    addr TEXT NOT NULL,
    protocol TEXT NOT NULL,
    port INTEGER NOT NULL,
    cred_id TEXT NOT NULL PRIMARY KEY,
    node_id TEXT NOT NULL,
    session TEXT NOT NULL
);
CREATE INDEX node_cred_by_node ON node_cred (node_id);
-- For counting the credentials that still use a session before its release.
CREATE INDEX node_cred_by_session ON node_cred (session);

-- The same for short-lived use.
CREATE TABLE temp_cred (
    addr TEXT NOT NULL,
    protocol TEXT NOT NULL,
    port INTEGER NOT NULL,
    cred_id TEXT NOT NULL PRIMARY KEY,
    node_id TEXT NOT NULL,
    session TEXT NOT NULL
);
CREATE INDEX temp_cred_by_node ON temp_cred (node_id);

-- Two writers of one new attribute may both find none and insert: the later value stays, and neither
-- fails.
CREATE TABLE node_attr (
    node_id TEXT NOT NULL,
    app TEXT NOT NULL,
    attr TEXT NOT NULL,
    value TEXT NOT NULL,
    PRIMARY KEY (node_id, app, attr) ON CONFLICT REPLACE
);
