// The `files` back-end: the three name databases as text files in one
// directory (dbroute_cfg.files_dir, else the installed default).
//
// Handles are cheap: a handle remembers its database file and, during a
// walk, the snapshot being walked, so a walk sees one consistent version of
// the file even if a writer replaces it meanwhile. Lookups always consult
// the current file (one stat when it has not changed).
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <type_traits>
#include <vector>

#include "common/c_api.hh"
#include "contract/backend.h"
#include "contract/dbroute.h"
#include "store.hh"

#ifndef VYR_FILES_DEFAULT_DIR
#error "VYR_FILES_DEFAULT_DIR must name the installed database directory"
#endif

namespace vyr::files {
namespace {

constexpr std::uint32_t kHandleMagic = 0x66696c65;  // "file"

struct Handle {
    std::uint32_t magic = kHandleMagic;
    Db db;
    std::string path;  // the database file
    SnapshotPtr walk;  // the version being walked; empty outside a walk
    std::size_t pos = 0;

    Handle(Db d, std::string p) : db(d), path(std::move(p)) {}
    ~Handle() { magic = 0; }
};

// Entries <-> records, per database.
template <class Rec>
struct Traits;

template <>
struct Traits<macent_t> {
    static constexpr Db db = Db::Mac;
    static void fill(macent_t& r, const Entry& e) {
        r.lev1 = static_cast<std::uint8_t>(e.f[0]);
        r.cat1 = e.f[1];
        r.lev2 = static_cast<std::uint8_t>(e.f[2]);
        r.cat2 = e.f[3];
    }
    static Entry entry(const macent_t& r) { return {r.name, {r.lev1, r.cat1, r.lev2, r.cat2}}; }
};

template <>
struct Traits<levent_t> {
    static constexpr Db db = Db::Lev;
    static void fill(levent_t& r, const Entry& e) { r.value = static_cast<std::uint8_t>(e.f[0]); }
    static Entry entry(const levent_t& r) { return {r.name, {r.value}}; }
};

template <>
struct Traits<catent_t> {
    static constexpr Db db = Db::Cat;
    static void fill(catent_t& r, const Entry& e) { r.value = e.f[0]; }
    static Entry entry(const catent_t& r) { return {r.name, {r.value}}; }
};

Handle* handle_of(void* db, Db expected) {
    auto* h = static_cast<Handle*>(db);
    if (h == nullptr || h->magic != kHandleMagic || h->db != expected) {
        errno = EINVAL;
        return nullptr;
    }
    return h;
}

std::string configured_dir() {
    const char* dir = dbroute_cfg.files_dir;
    const std::size_t len = strnlen(dir, sizeof dbroute_cfg.files_dir);
    if (len == 0 || len == sizeof dbroute_cfg.files_dir) return VYR_FILES_DEFAULT_DIR;
    return std::string(dir, len);
}

void* open_db(Db db) noexcept {
    return c_call<void*>(nullptr, [db]() -> void* {
        std::string dir = configured_dir();
        struct stat st{};
        if (::stat(dir.c_str(), &st) != 0) return nullptr;
        if (!S_ISDIR(st.st_mode)) {
            errno = ENOTDIR;
            return nullptr;
        }
        dir += '/';
        dir += file_name(db);
        return new Handle(db, std::move(dir));
    });
}

int close_db(void* db, Db kind) noexcept {
    Handle* h = handle_of(db, kind);
    if (h == nullptr) return -1;
    delete h;
    return 0;
}

int set_walk(void* db, Db kind) noexcept {
    return c_call(-1, [&] {
        Handle* h = handle_of(db, kind);
        if (h == nullptr) return -1;
        SnapshotPtr snap;
        if (const int err = current(kind, h->path, snap); err != 0) {
            errno = err;
            return -1;
        }
        h->walk = std::move(snap);
        h->pos = 0;
        return 0;
    });
}

int end_walk(void* db, Db kind) noexcept {
    Handle* h = handle_of(db, kind);
    if (h == nullptr) return -1;
    h->walk.reset();
    h->pos = 0;
    return 0;
}

// A new caller-owned record: both blocks from malloc, released with free.
template <class Rec>
Rec* record_of(const Entry& e) {
    malloc_ptr<Rec> rec(static_cast<Rec*>(std::calloc(1, sizeof(Rec))));
    if (!rec) return nullptr;
    rec->name = strndup(e.name.data(), e.name.size());
    if (rec->name == nullptr) return nullptr;
    Traits<Rec>::fill(*rec, e);
    return rec.release();
}

template <class Rec>
Rec* get_next(void* db) noexcept {
    constexpr Db kind = Traits<Rec>::db;
    Handle* h = handle_of(db, kind);
    if (h == nullptr) return nullptr;
    if (!h->walk && set_walk(db, kind) != 0) return nullptr;
    if (h->pos >= h->walk->entries.size()) return nullptr;  // end of the walk
    Rec* rec = record_of<Rec>(h->walk->entries[h->pos]);
    if (rec != nullptr) ++h->pos;  // a failed record can be asked for again
    return rec;
}

// Looks `find` up in the current version of the database; a miss is ENOENT.
template <class Rec, class Find>
Rec* lookup(void* db, Find&& find) noexcept {
    return c_call<Rec*>(nullptr, [&]() -> Rec* {
        constexpr Db kind = Traits<Rec>::db;
        Handle* h = handle_of(db, kind);
        if (h == nullptr) return nullptr;
        SnapshotPtr snap;
        if (const int err = current(kind, h->path, snap); err != 0) {
            errno = err;
            return nullptr;
        }
        const Entry* e = find(*snap);
        if (e == nullptr) {
            errno = ENOENT;
            return nullptr;
        }
        return record_of<Rec>(*e);
    });
}

template <class Rec>
Rec* get_by_name(void* db, const char* name) noexcept {
    if (name == nullptr) {
        errno = EINVAL;
        return nullptr;
    }
    return lookup<Rec>(db, [name](const Snapshot& s) { return s.find_name(name); });
}

template <class Rec>
Rec* get_by_value(void* db, std::uint64_t value) noexcept {
    return lookup<Rec>(db, [value](const Snapshot& s) { return s.find_value(value); });
}

int edit_file(void* db, Db kind, const Edit& edit) noexcept {
    return c_call(-1, [&] {
        Handle* h = handle_of(db, kind);
        if (h == nullptr) return -1;
        if (const int err = rewrite(kind, h->path, edit); err != 0) {
            errno = err;
            return -1;
        }
        return 0;
    });
}

template <class Rec>
int put(void* db, const Rec* rec) noexcept {
    constexpr Db kind = Traits<Rec>::db;
    if (rec == nullptr || rec->name == nullptr) {
        errno = EINVAL;
        return -1;
    }
    const Entry entry = Traits<Rec>::entry(*rec);
    const int verdict = c_call(-1, [&] { return storable(kind, entry) ? 1 : 0; });
    if (verdict < 0) return -1;  // no memory for the check
    if (verdict == 0) {
        errno = EINVAL;
        return -1;
    }
    return edit_file(db, kind, Edit{Edit::Op::Put, entry, {}, 0});
}

template <class Rec>
int remove_name(void* db, const char* name) noexcept {
    if (name == nullptr) {
        errno = EINVAL;
        return -1;
    }
    return edit_file(db, Traits<Rec>::db, Edit{Edit::Op::RemoveName, {}, name, 0});
}

template <class Rec>
int remove_value(void* db, std::uint64_t value) noexcept {
    return edit_file(db, Traits<Rec>::db, Edit{Edit::Op::RemoveValue, {}, {}, value});
}

// The user's name from the system's user database; ENOENT if there is none.
int user_name(std::uint32_t uid, std::string& name) {
    std::vector<char> buf(1024);
    for (;;) {
        struct passwd pw{};
        struct passwd* found = nullptr;
        const int rc = ::getpwuid_r(static_cast<uid_t>(uid), &pw, buf.data(), buf.size(), &found);
        if (rc == ERANGE && buf.size() < (1u << 20)) {
            buf.resize(buf.size() * 2);
            continue;
        }
        if (rc != 0) return rc;
        if (found == nullptr) return ENOENT;
        name = pw.pw_name;
        return 0;
    }
}

macent_t* get_by_uid(void* db, std::uint32_t uid) noexcept {
    std::string name;
    const int err = c_call(ENOMEM, [&] { return user_name(uid, name); });
    if (err != 0) {
        errno = err;
        return nullptr;
    }
    return get_by_name<macent_t>(db, name.c_str());
}

}  // namespace
}  // namespace vyr::files

using vyr::files::Db;
namespace vf = vyr::files;

extern "C" {

// ---- user label database ----
void* files_openmacdb_r(void) noexcept { return vf::open_db(Db::Mac); }
int files_closemacdb_r(void* db) noexcept { return vf::close_db(db, Db::Mac); }
int files_setmacent_r(void* db) noexcept { return vf::set_walk(db, Db::Mac); }
int files_endmacent_r(void* db) noexcept { return vf::end_walk(db, Db::Mac); }
macent_t* files_getmacent_r(void* db) noexcept { return vf::get_next<macent_t>(db); }
macent_t* files_getmacnam_r(void* db, const char* name) noexcept { return vf::get_by_name<macent_t>(db, name); }
macent_t* files_getmacuid_r(void* db, uint32_t uid) noexcept { return vf::get_by_uid(db, uid); }
int files_putmacent_r(void* db, const macent_t* ent) noexcept { return vf::put(db, ent); }
int files_rmmacnam_r(void* db, const char* name) noexcept { return vf::remove_name<macent_t>(db, name); }

// ---- level database ----
void* files_openlevdb_r(void) noexcept { return vf::open_db(Db::Lev); }
int files_closelevdb_r(void* db) noexcept { return vf::close_db(db, Db::Lev); }
int files_setlevent_r(void* db) noexcept { return vf::set_walk(db, Db::Lev); }
int files_endlevent_r(void* db) noexcept { return vf::end_walk(db, Db::Lev); }
levent_t* files_getlevent_r(void* db) noexcept { return vf::get_next<levent_t>(db); }
levent_t* files_getlevnam_r(void* db, const char* name) noexcept { return vf::get_by_name<levent_t>(db, name); }
levent_t* files_getlevval_r(void* db, unsigned int value) noexcept {
    return vf::get_by_value<levent_t>(db, value & 0xffu);
}
int files_putlevent_r(void* db, const levent_t* ent) noexcept { return vf::put(db, ent); }
int files_rmlevnam_r(void* db, const char* name) noexcept { return vf::remove_name<levent_t>(db, name); }
int files_rmlevval_r(void* db, unsigned int value) noexcept {
    return vf::remove_value<levent_t>(db, value & 0xffu);
}

// ---- category database ----
void* files_opencatdb_r(void) noexcept { return vf::open_db(Db::Cat); }
int files_closecatdb_r(void* db) noexcept { return vf::close_db(db, Db::Cat); }
int files_setcatent_r(void* db) noexcept { return vf::set_walk(db, Db::Cat); }
int files_endcatent_r(void* db) noexcept { return vf::end_walk(db, Db::Cat); }
catent_t* files_getcatent_r(void* db) noexcept { return vf::get_next<catent_t>(db); }
catent_t* files_getcatnam_r(void* db, const char* name) noexcept { return vf::get_by_name<catent_t>(db, name); }
catent_t* files_getcatval_r(void* db, uint64_t value) noexcept { return vf::get_by_value<catent_t>(db, value); }
int files_putcatent_r(void* db, const catent_t* ent) noexcept { return vf::put(db, ent); }
int files_rmcatnam_r(void* db, const char* name) noexcept { return vf::remove_name<catent_t>(db, name); }
int files_rmcatval_r(void* db, uint64_t value) noexcept { return vf::remove_value<catent_t>(db, value); }

}  // extern "C"

// Every entry must fit the slot libvyr binds it to.
#define FILES_CHECK_SLOT(fn, slot_type) \
    static_assert(std::is_convertible_v<decltype(&fn), slot_type>, #fn " does not match its slot")
FILES_CHECK_SLOT(files_openmacdb_r, vyr_be_open_fn);
FILES_CHECK_SLOT(files_closemacdb_r, vyr_be_handle_fn);
FILES_CHECK_SLOT(files_setmacent_r, vyr_be_handle_fn);
FILES_CHECK_SLOT(files_endmacent_r, vyr_be_handle_fn);
FILES_CHECK_SLOT(files_getmacent_r, vyr_be_getmacent_fn);
FILES_CHECK_SLOT(files_getmacnam_r, vyr_be_getmacnam_fn);
FILES_CHECK_SLOT(files_getmacuid_r, vyr_be_getmacuid_fn);
FILES_CHECK_SLOT(files_putmacent_r, vyr_be_putmacent_fn);
FILES_CHECK_SLOT(files_rmmacnam_r, vyr_be_rmmacnam_fn);
FILES_CHECK_SLOT(files_openlevdb_r, vyr_be_open_fn);
FILES_CHECK_SLOT(files_closelevdb_r, vyr_be_handle_fn);
FILES_CHECK_SLOT(files_setlevent_r, vyr_be_handle_fn);
FILES_CHECK_SLOT(files_endlevent_r, vyr_be_handle_fn);
FILES_CHECK_SLOT(files_getlevent_r, vyr_be_getlevent_fn);
FILES_CHECK_SLOT(files_getlevnam_r, vyr_be_getlevnam_fn);
FILES_CHECK_SLOT(files_getlevval_r, vyr_be_getlevval_fn);
FILES_CHECK_SLOT(files_putlevent_r, vyr_be_putlevent_fn);
FILES_CHECK_SLOT(files_rmlevnam_r, vyr_be_rmlevnam_fn);
FILES_CHECK_SLOT(files_rmlevval_r, vyr_be_rmlevval_fn);
FILES_CHECK_SLOT(files_opencatdb_r, vyr_be_open_fn);
FILES_CHECK_SLOT(files_closecatdb_r, vyr_be_handle_fn);
FILES_CHECK_SLOT(files_setcatent_r, vyr_be_handle_fn);
FILES_CHECK_SLOT(files_endcatent_r, vyr_be_handle_fn);
FILES_CHECK_SLOT(files_getcatent_r, vyr_be_getcatent_fn);
FILES_CHECK_SLOT(files_getcatnam_r, vyr_be_getcatnam_fn);
FILES_CHECK_SLOT(files_getcatval_r, vyr_be_getcatval_fn);
FILES_CHECK_SLOT(files_putcatent_r, vyr_be_putcatent_fn);
FILES_CHECK_SLOT(files_rmcatnam_r, vyr_be_rmcatnam_fn);
FILES_CHECK_SLOT(files_rmcatval_r, vyr_be_rmcatval_fn);
#undef FILES_CHECK_SLOT
