#include "store.hh"

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <mutex>

namespace vyr::files {
namespace {

constexpr mode_t kNewFileMode = 0644;
// A file being written is "<database>.tmp-XXXXXX" until it is renamed.
constexpr const char* kTempInfix = ".tmp-";

// Closes a descriptor on every path out of a scope.
class Fd {
public:
    explicit Fd(int fd) : fd_(fd) {}
    Fd(const Fd&) = delete;
    Fd& operator=(const Fd&) = delete;
    ~Fd() {
        if (fd_ >= 0) ::close(fd_);
    }
    int get() const { return fd_; }
    // Closes now and reports the result (close can report a failed write).
    int close() {
        const int rc = ::close(fd_);
        fd_ = -1;
        return rc;
    }

private:
    int fd_;
};

// A temporary file that disappears unless it was renamed into place.
class TempFile {
public:
    explicit TempFile(std::string path) : path_(std::move(path)) {}
    TempFile(const TempFile&) = delete;
    TempFile& operator=(const TempFile&) = delete;
    ~TempFile() {
        if (!committed_) ::unlink(path_.c_str());
    }
    const char* path() const { return path_.c_str(); }
    void commit() { committed_ = true; }

private:
    std::string path_;
    bool committed_ = false;
};

std::int64_t mtime_ns(const struct stat& st) {
    return static_cast<std::int64_t>(st.st_mtim.tv_sec) * 1'000'000'000 + st.st_mtim.tv_nsec;
}

FileId id_of(const struct stat& st) {
    return FileId{true, st.st_dev, st.st_ino, st.st_size, mtime_ns(st)};
}

// Reads the whole file. A missing file reads as empty with exists = false.
int read_file(const std::string& path, std::string& text, FileId& id, struct stat& st) {
    text.clear();
    id = FileId{};
    Fd fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY));
    if (fd.get() < 0) return errno == ENOENT ? 0 : errno;
    if (::fstat(fd.get(), &st) != 0) return errno;
    if (!S_ISREG(st.st_mode)) return EINVAL;
    id = id_of(st);
    // One spare byte lets the read that reports the end fit without growing.
    text.resize(static_cast<std::size_t>(st.st_size) + 1);
    std::size_t used = 0;
    for (;;) {
        if (used == text.size()) text.resize(text.size() * 2);  // the file grew meanwhile
        const ssize_t n = ::read(fd.get(), text.data() + used, text.size() - used);
        if (n < 0) {
            if (errno == EINTR) continue;
            return errno;
        }
        if (n == 0) break;
        used += static_cast<std::size_t>(n);
    }
    text.resize(used);
    return 0;
}

std::shared_ptr<Snapshot> parse_snapshot(Db db, const std::string& path) {
    auto snap = std::make_shared<Snapshot>();
    struct stat st{};
    snap->path = path;
    if (const int err = read_file(path, snap->text, snap->id, st); err != 0) {
        errno = err;
        return nullptr;
    }
    for_each_line(db, snap->text, [&](std::size_t, std::string_view, LineKind kind, const Entry& e) {
        if (kind != LineKind::Entry) return true;  // readers skip what is not an entry
        const std::size_t index = snap->entries.size();
        snap->entries.push_back(e);
        snap->by_name.emplace(e.name, index);
        if (db != Db::Mac) snap->by_value.emplace(e.f[0], index);
        return true;
    });
    return snap;
}

struct CacheSlot {
    std::mutex mu;
    SnapshotPtr snap;
};

// Built on first use: nothing runs when the plug-in is loaded.
CacheSlot& cache_slot(Db db) {
    static CacheSlot slots[3];
    return slots[static_cast<int>(db)];
}

std::string join(const std::string& path, const char* suffix) {
    std::string s = path;
    s += suffix;
    return s;
}

std::string dir_of(const std::string& path) {
    const std::size_t slash = path.rfind('/');
    if (slash == std::string::npos) return ".";
    return slash == 0 ? "/" : path.substr(0, slash);
}

// Removes what writers killed before their rename left behind. Only called
// with the lock held: then no writer is active and every temporary file of
// this database is stale.
void remove_stale_temps(const std::string& path) {
    const std::string dir = dir_of(path);
    const std::string prefix = path.substr(path.rfind('/') + 1) + kTempInfix;
    DIR* d = ::opendir(dir.c_str());
    if (d == nullptr) return;
    while (const struct dirent* ent = ::readdir(d)) {
        const std::string_view name = ent->d_name;
        if (name.size() == prefix.size() + 6 && name.substr(0, prefix.size()) == prefix)
            ::unlinkat(::dirfd(d), ent->d_name, 0);
    }
    ::closedir(d);
}

// Builds the new file contents from the old. Returns 0 or an errno value.
int apply(Db db, const std::string& path, std::string_view old_text, const Edit& edit, std::string& out) {
    std::string put_line;
    if (edit.op == Edit::Op::Put) compose_line(db, edit.entry, put_line);
    out.reserve(old_text.size() + put_line.size() + 1);

    bool matched = false;
    std::size_t bad_line = 0;
    for_each_line(db, old_text, [&](std::size_t number, std::string_view line, LineKind kind, const Entry& e) {
        if (kind == LineKind::Malformed) {
            bad_line = number;
            return false;
        }
        bool drop = false;
        if (kind == LineKind::Entry) {
            switch (edit.op) {
            case Edit::Op::Put:
                if (e.name == edit.entry.name) {
                    // The first entry of that name is replaced where it
                    // stands; later duplicates are dropped.
                    if (!matched) {
                        out += put_line;
                        out += '\n';
                    }
                    drop = true;
                }
                break;
            case Edit::Op::RemoveName: drop = e.name == edit.name; break;
            case Edit::Op::RemoveValue: drop = e.f[0] == edit.value; break;
            }
        }
        matched = matched || drop;
        if (!drop) {
            out += line;
            out += '\n';
        }
        return true;
    });
    if (bad_line != 0) {
        std::fprintf(stderr, "files: %s:%zu: not a valid entry line; fix or remove it, the file was not changed\n",
                     path.c_str(), bad_line);
        return EBADMSG;
    }
    if (edit.op == Edit::Op::Put) {
        if (!matched) {
            out += put_line;
            out += '\n';
        }
        return 0;
    }
    return matched ? 0 : ENOENT;
}

int write_all(int fd, std::string_view data) {
    while (!data.empty()) {
        const ssize_t n = ::write(fd, data.data(), data.size());
        if (n < 0) {
            if (errno == EINTR) continue;
            return errno;
        }
        data.remove_prefix(static_cast<std::size_t>(n));
    }
    return 0;
}

// Later than both the clock and the replaced file (see the invariant in
// store.hh); the clock alone may stand still within one tick.
struct timespec next_mtime(std::int64_t old_ns) {
    struct timespec now{};
    ::clock_gettime(CLOCK_REALTIME, &now);
    std::int64_t ns = static_cast<std::int64_t>(now.tv_sec) * 1'000'000'000 + now.tv_nsec;
    if (ns <= old_ns) ns = old_ns + 1;
    return {static_cast<time_t>(ns / 1'000'000'000), static_cast<long>(ns % 1'000'000'000)};
}

// Writes `data` to a new file beside `path` and renames it over `path`.
int replace_file(const std::string& path, std::string_view data, const FileId& old_id,
                 const struct stat& old_st) {
    // Everything that may allocate happens before the rename: once the new
    // file is in place, the write has succeeded and must be reported so.
    const std::string dir_path = dir_of(path);
    TempFile tmp(join(path, kTempInfix) + "XXXXXX");
    Fd fd(::mkostemp(const_cast<char*>(tmp.path()), O_CLOEXEC));
    if (fd.get() < 0) {
        tmp.commit();  // nothing was created
        return errno;
    }
    if (const int err = write_all(fd.get(), data); err != 0) return err;
    if (::fchmod(fd.get(), old_id.exists ? (old_st.st_mode & 07777) : kNewFileMode) != 0) return errno;
    if (old_id.exists && (old_st.st_uid != ::geteuid() || old_st.st_gid != ::getegid()) &&
        ::fchown(fd.get(), old_st.st_uid, old_st.st_gid) != 0)
        return errno;
    const struct timespec times[2] = {{0, UTIME_OMIT}, next_mtime(old_id.mtime_ns)};
    if (::futimens(fd.get(), times) != 0) return errno;
    if (::fsync(fd.get()) != 0) return errno;
    if (fd.close() != 0) return errno;
    if (::rename(tmp.path(), path.c_str()) != 0) return errno;
    tmp.commit();

    // Make the rename itself durable. The new file is already in place, so a
    // failure here is not reported as a failed write.
    Fd dir(::open(dir_path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (dir.get() >= 0) ::fsync(dir.get());
    return 0;
}

}  // namespace

const Entry* Snapshot::find_name(std::string_view name) const {
    const auto it = by_name.find(name);
    return it == by_name.end() ? nullptr : &entries[it->second];
}

const Entry* Snapshot::find_value(std::uint64_t value) const {
    const auto it = by_value.find(value);
    return it == by_value.end() ? nullptr : &entries[it->second];
}

const char* file_name(Db db) {
    switch (db) {
    case Db::Mac: return "users";
    case Db::Lev: return "levels";
    case Db::Cat: return "categories";
    }
    return "";
}

int current(Db db, const std::string& path, SnapshotPtr& out) {
    FileId id;
    struct stat st{};
    if (::stat(path.c_str(), &st) == 0)
        id = id_of(st);
    else if (errno != ENOENT)
        return errno;

    CacheSlot& slot = cache_slot(db);
    {
        std::lock_guard lock(slot.mu);
        if (slot.snap && slot.snap->id == id && slot.snap->path == path) {
            out = slot.snap;
            return 0;
        }
    }
    // Parse outside the lock; the newest parse wins the slot.
    std::shared_ptr<Snapshot> fresh = parse_snapshot(db, path);
    if (!fresh) return errno;
    out = fresh;
    std::lock_guard lock(slot.mu);
    slot.snap = std::move(fresh);
    return 0;
}

int rewrite(Db db, const std::string& path, const Edit& edit) {
    Fd lock(::open(join(path, ".lock").c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, kNewFileMode));
    if (lock.get() < 0) return errno;
    while (::flock(lock.get(), LOCK_EX) != 0)
        if (errno != EINTR) return errno;

    remove_stale_temps(path);

    // Always read the file afresh under the lock: the cache may predate an
    // edit made by another process.
    std::string old_text;
    FileId old_id;
    struct stat old_st{};
    if (const int err = read_file(path, old_text, old_id, old_st); err != 0) return err;

    std::string new_text;
    if (const int err = apply(db, path, old_text, edit, new_text); err != 0) return err;
    return replace_file(path, new_text, old_id, old_st);
    // The lock is released when `lock` closes.
}

}  // namespace vyr::files
