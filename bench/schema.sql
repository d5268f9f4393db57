-- The merged database as the daemon creates it: tables, first rows, indexes. The driver compares the
-- schema with the daemon's.
CREATE TABLE Status(id INTEGER PRIMARY KEY AUTOINCREMENT, mc_version CHAR(16) NOT NULL, mdate INTEGER NOT NULL, desc CHAR(80), etype INTEGER);
CREATE TABLE Statistics(id INTEGER PRIMARY KEY AUTOINCREMENT, volume TEXT NOT NULL, photos_xcoded INTEGER NOT NULL, photos_total INTEGER NOT NULL, last_updated_time INTEGER NOT NULL);
INSERT INTO Status(mc_version, mdate, desc, etype) VALUES('2.0', 1000, '', 0);
CREATE TABLE Folders(folder_id INTEGER PRIMARY KEY AUTOINCREMENT, parent_folder_id INTEGER NOT NULL, name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT NULL);
INSERT INTO Folders(parent_folder_id, name, modified_date, volume) VALUES(-1, '/shares/', 0, '<DUMMY>');
CREATE TABLE Files(file_id INTEGER PRIMARY KEY AUTOINCREMENT, folder_id INTEGER NOT NULL, name TEXT NOT NULL, modified_date INTEGER NOT NULL, volume TEXT NOT NULL, created_date INTEGER NOT NULL, FOREIGN KEY(folder_id) REFERENCES Folders(folder_id) ON DELETE CASCADE);
CREATE INDEX Folders_folderId ON Folders(parent_folder_id);
CREATE INDEX Folders_path ON Folders(name);
CREATE INDEX Files_folderId ON Files(folder_id);
CREATE INDEX Files_name ON Files(name);
