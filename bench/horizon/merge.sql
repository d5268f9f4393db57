-- The horizon: merges a whole catalog into a new database as fast as SQLite copies rows from one file
-- into another. For the sqlite3 shell, started in the checkout with the new file as its database and
-- the parameters :catalog (path) and :volume (mount point with a trailing separator).
-- The catalogs of the benchmark have no rows that a merge leaves out, except those that these
-- statements leave out.
PRAGMA main.cache_size = -65536;
ATTACH :catalog AS catalog;
BEGIN IMMEDIATE;
.read bench/schema.sql
INSERT INTO main.Folders(folder_id, parent_folder_id, name, modified_date, volume)
  VALUES(2, 1, :volume, 0, :volume);
INSERT INTO main.Folders(folder_id, parent_folder_id, name, modified_date, volume)
  SELECT id + 2, CASE folderId WHEN -1 THEN 2 ELSE folderId + 2 END, :volume || path,
         lastModifiedDate, :volume
  FROM catalog.Folders
  WHERE isSystem = 0 AND isBackup = 0 AND isHidden = 0 AND isDeleted = 0;
INSERT INTO main.Files(folder_id, name, modified_date, volume, created_date)
  SELECT f.folderId + 2, f.name, f.lastModifiedDate, :volume, f.lastModifiedDate
  FROM catalog.Files f CROSS JOIN catalog.Transcodings t
  WHERE f.id = t.sourceId AND t.profile = 'cb62bbdd389b48898f2e5244977cb2c5' AND t.status = 1
    AND f.isDeleted = 0 AND f.isSystem = 0;
INSERT INTO main.Statistics(volume, photos_xcoded, photos_total, last_updated_time)
  SELECT :volume, count(*) FILTER (WHERE status = 3), count(*),
         (SELECT max(lastUpdatedDate) FROM catalog.Transcodings)
  FROM catalog.Files
  WHERE category = 3 AND isSystem = 0 AND isBackup = 0 AND isHidden = 0 AND isDeleted = 0;
COMMIT;
