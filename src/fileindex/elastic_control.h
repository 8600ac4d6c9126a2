// The commands that the search engine takes for a share's index: its schema, documents, lifecycle and suggestions.
//
// Each is one or more requests over the channel of common/comm.h, and passes on what that throws. An engine whose
// database is not open yet is asked again every 30 s, a busy one every 15 to 19 minutes, both without end; the
// administrators get a notice after ten busy answers. A `share` is a share's name, a `path` a full path without
// a slash at its end, which is also the identity of the file's document. Thread-safe; nothing is kept between calls.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include <json/json.h>

#include "common/export.h"

namespace quarrox::fileindex::elastic {

// The identifier of a share's index.
QUARROX_API std::string GetFileIndexID(const std::string& share);

// What an index is made with. The last two throw Error 502 where the text in the library is damaged.
QUARROX_API Json::Value GetFileIndexSettings();
QUARROX_API Json::Value GetFileIndexMappings();
QUARROX_API Json::Value GetFileIndexEventHandler();

// Throws Error 916 with the response where that has no documents' list.
QUARROX_API bool IsDocumentExists(const std::string& share, const std::string& path);

// Makes or replaces the document of the file at a path; `need_meta`: with what is in the file. Throws Error 914 where
// the file cannot be looked at or read; errno is then what the system says about it, 0 where that is not the reason.
QUARROX_API void IndexUpsert(const std::string& share, const std::string& path, bool need_meta);

// Why the last file of this thread could not be read, in words; empty where it could.
QUARROX_API std::string LastReadFailure();

// What reads the contents of files, as vexo/content_extract.h says.
QUARROX_API Json::Value ReaderFeatures();

// Refreshes what the file system says of a file. Throws Error 917 where it has no document, 914 as IndexUpsert.
QUARROX_API void IndexAttr(const std::string& share, const std::string& path);

// As IndexAttr, and true, where the document says the same of the file's owner, size and time of change as the disk
// does, or both are a directory's. Else false: another file may stand there by now, and the text in the document would
// get that one's owner and rights. False too where there is no document. Throws Error 914 as IndexUpsert.
QUARROX_API bool IndexAttrOfSame(const std::string& share, const std::string& path);

// Deletes the document of a path; all documents below a directory, its own not included.
QUARROX_API void IndexDel(const std::string& share, const std::string& path);
QUARROX_API void IndexDelDir(const std::string& share, const std::string& path);

// Moves the document of `old_path` and every document below it. What the engine refuses of the latter is logged and
// stays where it was. Throws Error 917 where `old_path` has no document, 916 as IsDocumentExists, 120 where a document
// below lacks its name or parent. `between` is called now and then on the way; what it throws ends the rename
// there.
QUARROX_API void IndexRename(const std::string& share, const std::string& new_path, const std::string& old_path,
                             const std::function<void()>& between = {});

// Makes the accepted changes durable and visible to searches. Where that fails and the share has no room, sets the
// share's status flag 1 and throws Error 1003 instead.
QUARROX_API void IndexCommit(const std::string& share);

// Appends the paths of all documents below a directory that the engine returns for one query, in its order. Takes the
// index's identifier, not the share's name. Throws Error 916 as IsDocumentExists, with `paths` as it was.
QUARROX_API void IndexGetByPrefixPath(const std::string& index_id, const std::string& path,
                                      std::vector<std::string>& paths);

// An index in the share's own database directory. Throws Error 800 where there is no such share.
QUARROX_API void ShareIndexCreate(const std::string& share);
QUARROX_API void ShareIndexDelete(const std::string& share);
QUARROX_API void ShareIndexPause(const std::string& share);
QUARROX_API void ShareIndexResume(const std::string& share);

// Tells the engine another identifier and place of an index, or only another place.
QUARROX_API void ShareIndexRename(const std::string& old_share, const std::string& new_share,
                                  const std::string& db_path);
QUARROX_API void ShareIndexMigrate(const std::string& share, const std::string& db_path);

// Appends the databases whose suggestion data is missing or damaged.
QUARROX_API void ListUnAvailTermSuggDB(std::vector<std::string>& dbs);

// Takes the words of documents into a database's suggestions, with one request, also for no document.
QUARROX_API void UpdateTermSuggestion(const std::string& db, const std::vector<std::string>& doc_ids);

}  // namespace quarrox::fileindex::elastic
