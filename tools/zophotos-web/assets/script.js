// The one script of all pages. It reads these members of the JSON interface. Identifiers of photos
// and folders are decimal texts, because they can be larger than JavaScript's exact numbers.
//
//   PHOTO   {"id": "7516192769", "name": "a.jpg", "path": "/shares/Photos/a.jpg", "folder": "2",
//            "volume": "/shares/Photos/", "modified": "2026-11-21T08:15:00Z" or null,
//            "local_time": "2026-11-21 09:15:00"}
//   FOLDER  {"id": "2", "parent": "1" or null, "name": "Sea", "path": "/shares/Photos/Sea/",
//            "volume": "/shares/Photos/", "has_folders": true, "has_photos": true}
//   VOLUME  {"volume": "/shares/Photos/", "merged": true, "gone": false, "transcoded": 1, "total": 2,
//            "merged_up_to": "2026-11-21T08:15:00Z" or null, "local_merged_up_to": text or null,
//            "state": text or null, "folders_waiting": 0 or null, "waiting": 0 or null,
//            "failed": 0 or null, "rendering": false, "activity": "being indexed" or ""}
//
//   /api/photos?before=ID or after=ID&count=100&words=&volume=&folder=&month=
//                               {"photos": [PHOTO, ...], newest first, "more": true}: there are more
//                               in that direction
//   /api/photos/ID?words=&...   PHOTO with "newer": "ID" or null, "older": "ID" or null
//   /api/folders?parent=ID&after=ID&count=100    {"folders": [FOLDER, ...], "more": true}
//   /api/volumes                {"volumes": [VOLUME, ...]}
//   /api/status                 {"state": "no_database", "building", "current" or "failed",
//                               "done": 0, "total": 0, "reason": text, "version": 1}
//   /api/events                 "event: change" with the version as its data
