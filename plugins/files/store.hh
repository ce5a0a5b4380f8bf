// Storage of the files back-end: one text file per database in a directory.
//
// Readers parse a file once and share the result (a Snapshot) for as long as
// the file keeps its identity: device, inode, size and modification time in
// nanoseconds. Writers never modify a file in place: under an exclusive
// flock on "<file>.lock" they read the current file, build the new contents,
// write them to a temporary file in the same directory, fsync it and rename
// it over the old one. Readers therefore see either the old or the new file,
// and concurrent writers are serialised so that no update is lost.
//
// Invariant kept by writers: every replacement gets a modification time
// strictly later than the file it replaces, so a cached parse can never be
// mistaken for a newer file that happens to reuse its inode and size.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "lines.hh"

namespace vyr::files {

struct FileId {
    bool exists = false;
    dev_t dev = 0;
    ino_t ino = 0;
    off_t size = 0;
    std::int64_t mtime_ns = 0;
    bool operator==(const FileId&) const = default;
};

// A parsed database file. Immutable once built; entry names view `text`, so
// a Snapshot is never copied or moved, only shared.
struct Snapshot {
    std::string path;
    FileId id;
    std::string text;
    std::vector<Entry> entries;  // file order = walk order
    std::unordered_map<std::string_view, std::size_t> by_name;  // first occurrence
    std::unordered_map<std::uint64_t, std::size_t> by_value;    // Lev/Cat: first occurrence

    const Entry* find_name(std::string_view name) const;
    const Entry* find_value(std::uint64_t value) const;
};
using SnapshotPtr = std::shared_ptr<const Snapshot>;

// File name of each database inside the configured directory.
const char* file_name(Db db);

// Stores the current contents of `path` in `out`, reusing the last parse
// when the file is unchanged. A missing file is an empty database. Returns 0
// or an errno value. May throw std::bad_alloc.
int current(Db db, const std::string& path, SnapshotPtr& out);

// A change to a database file.
struct Edit {
    enum class Op { Put, RemoveName, RemoveValue } op;
    Entry entry;           // Put: the entry to store (replaces one of the same name)
    std::string_view name; // RemoveName
    std::uint64_t value;   // RemoveValue: matched against the first field
};

// Applies `edit` to the file `path` atomically, as described above. Returns
// 0 or an errno value: ENOENT when a removal matches nothing, EBADMSG when
// the file holds a line that is not an entry (reported on stderr; the file
// stays as it is). May throw std::bad_alloc; nothing is left behind then.
int rewrite(Db db, const std::string& path, const Edit& edit);

}  // namespace vyr::files
