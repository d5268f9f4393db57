-- Lists the ids of all files of a merged database, for delete.sql. For the sqlite3 shell, started in
-- the checkout with a new file as its database and the parameter :merged (path of the merged database).
ATTACH :merged AS merged;
CREATE TABLE FileIds(id INTEGER PRIMARY KEY);
INSERT INTO FileIds SELECT file_id FROM merged.Files;
