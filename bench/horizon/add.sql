-- The horizon of files that are added to existing folders: merges the files of a catalog that have
-- changed after :since into a database that merge.sql has filled from the same catalog. For the
-- sqlite3 shell, started as for merge.sql.
PRAGMA main.cache_size = -65536;
ATTACH :catalog AS catalog;
BEGIN IMMEDIATE;
INSERT INTO main.Files(folder_id, name, modified_date, volume, created_date)
  SELECT f.folderId + 2, f.name, f.lastModifiedDate, :volume, f.lastModifiedDate
  FROM catalog.Files f CROSS JOIN catalog.Transcodings t
  WHERE f.id = t.sourceId AND t.lastUpdatedDate > :since
    AND t.profile = 'cb62bbdd389b48898f2e5244977cb2c5' AND t.status = 1
    AND f.isDeleted = 0 AND f.isSystem = 0;
UPDATE main.Statistics SET (photos_xcoded, photos_total, last_updated_time) =
  (SELECT count(*) FILTER (WHERE status = 3), count(*),
          (SELECT max(lastUpdatedDate) FROM catalog.Transcodings)
   FROM catalog.Files
   WHERE category = 3 AND isSystem = 0 AND isBackup = 0 AND isHidden = 0 AND isDeleted = 0)
  WHERE volume = :volume;
COMMIT;
