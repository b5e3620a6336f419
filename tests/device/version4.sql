-- Makes the database of a device one of version 4, with all that it holds.
BEGIN;
ALTER TABLE applications RENAME TO later_applications;
ALTER TABLE placeholders RENAME TO later_placeholders;
ALTER TABLE progress RENAME TO later_progress;
ALTER TABLE running RENAME TO later_running;
ALTER TABLE kept RENAME TO later_kept;
ALTER TABLE history RENAME TO later_history;

CREATE TABLE applications (
    identifier TEXT PRIMARY KEY,
    version TEXT,
    name TEXT,
    type TEXT NOT NULL,
    install_type INTEGER NOT NULL,
    container TEXT NOT NULL UNIQUE,
    bundle TEXT NOT NULL,
    icon TEXT NOT NULL,
    bytes INTEGER NOT NULL,
    arrived INTEGER NOT NULL
) STRICT;
CREATE INDEX applications_by_arrival ON applications (arrived);

CREATE TABLE placeholders (
    identifier TEXT PRIMARY KEY,
    version TEXT,
    name TEXT,
    type TEXT NOT NULL,
    install_type INTEGER NOT NULL,
    container TEXT NOT NULL UNIQUE,
    bundle TEXT NOT NULL,
    icon TEXT NOT NULL,
    bytes INTEGER NOT NULL,
    arrived INTEGER NOT NULL,
    unsynced_boot TEXT,
    sinf BLOB
) STRICT;
CREATE INDEX placeholders_by_arrival ON placeholders (arrived);
CREATE INDEX placeholders_unsynced ON placeholders (unsynced_boot)
    WHERE unsynced_boot IS NOT NULL;

CREATE TABLE progress (
    identifier TEXT PRIMARY KEY REFERENCES placeholders (identifier) ON DELETE CASCADE,
    state INTEGER NOT NULL,
    phase INTEGER NOT NULL,
    total INTEGER NOT NULL,
    completed INTEGER NOT NULL,
    unpacked INTEGER NOT NULL DEFAULT 0
) STRICT;

CREATE TABLE running (
    identifier TEXT PRIMARY KEY REFERENCES applications (identifier) ON DELETE CASCADE
) STRICT;

CREATE TABLE kept (
    id INTEGER PRIMARY KEY,
    identifier TEXT NOT NULL UNIQUE REFERENCES applications (identifier) ON DELETE CASCADE,
    version TEXT,
    name TEXT,
    install_type INTEGER NOT NULL,
    container TEXT NOT NULL UNIQUE,
    bundle TEXT NOT NULL,
    icon TEXT NOT NULL,
    bytes INTEGER NOT NULL
) STRICT;

CREATE TABLE history (
    id INTEGER PRIMARY KEY AUTOINCREMENT,
    time INTEGER NOT NULL,
    kind INTEGER NOT NULL,
    scenario TEXT NOT NULL,
    step INTEGER NOT NULL,
    party INTEGER NOT NULL,
    phase INTEGER NOT NULL,
    success INTEGER NOT NULL,
    identifier TEXT NOT NULL,
    description TEXT NOT NULL
) STRICT;

INSERT INTO applications SELECT * FROM later_applications;
INSERT INTO placeholders SELECT * FROM later_placeholders;
INSERT INTO progress SELECT * FROM later_progress;
INSERT INTO running SELECT * FROM later_running;
INSERT INTO kept SELECT * FROM later_kept;
INSERT INTO history SELECT * FROM later_history;
DROP TABLE later_progress;
DROP TABLE later_running;
DROP TABLE later_kept;
DROP TABLE later_placeholders;
DROP TABLE later_applications;
DROP TABLE later_history;
PRAGMA user_version = 4;
COMMIT;
