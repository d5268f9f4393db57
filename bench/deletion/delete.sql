-- Deletes files of a merged database by their ids, as fast as SQLite does it. For the sqlite3 shell,
-- started in the checkout with the merged database and the parameter :ids (path of the database that
-- ids.sql has filled).
PRAGMA main.cache_size = -65536;
ATTACH :ids AS ids;
BEGIN IMMEDIATE;
DELETE FROM main.Files WHERE file_id IN (SELECT id FROM ids.FileIds);
COMMIT;
