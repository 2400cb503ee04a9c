-- The whole fleet, from any server of the cluster. All of a device is on one server.
CREATE TABLE IF NOT EXISTS tally.rows_all AS tally.rows
ENGINE = Distributed({cluster}, tally, rows, cityHash64(device));
CREATE TABLE IF NOT EXISTS tally.logs_all AS tally.logs
ENGINE = Distributed({cluster}, tally, logs, cityHash64(device));
CREATE TABLE IF NOT EXISTS tally.files_all AS tally.files
ENGINE = Distributed({cluster}, tally, files, cityHash64(name));
