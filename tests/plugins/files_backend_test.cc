// The files back-end through its exported entries: round trips, walk order,
// replace and remove semantics, misses, bad input, and allocation failure.
#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdint>
#include <new>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "files_fixture.hh"
#include "support/failalloc.h"

namespace {

using namespace files_test;

class FilesBackend : public FilesDir {};

// Whether operator new allocates through the (interposed) malloc.
bool new_reaches_malloc() {
    bool failed = false;
    vyr_test::FailAlloc::arm(1);
    try {
        delete new char('x');
    } catch (const std::bad_alloc&) {
        failed = true;
    }
    vyr_test::FailAlloc::disarm();
    return failed;
}

std::vector<std::string> walk_levels(void* db) {
    std::vector<std::string> out;
    EXPECT_EQ(files_setlevent_r(db), 0);
    while (LevPtr e{files_getlevent_r(db)}) out.push_back(std::string(e->name) + "=" + std::to_string(e->value));
    files_endlevent_r(db);
    return out;
}

TEST_F(FilesBackend, LevelsRoundTrip) {
    LevDb db{files_openlevdb_r()};
    ASSERT_NE(db, nullptr);
    levent_t in[] = {{const_cast<char*>("low"), 0}, {const_cast<char*>("mid"), 7}, {const_cast<char*>("top"), 255}};
    for (const levent_t& e : in) ASSERT_EQ(files_putlevent_r(db.get(), &e), 0) << e.name;

    EXPECT_EQ(read_text(path("levels")), "low:0\nmid:7\ntop:255\n");
    EXPECT_EQ(walk_levels(db.get()), (std::vector<std::string>{"low=0", "mid=7", "top=255"}));
    for (const levent_t& e : in) {
        LevPtr by_name{files_getlevnam_r(db.get(), e.name)};
        ASSERT_NE(by_name, nullptr);
        EXPECT_EQ(by_name->value, e.value);
        LevPtr by_value{files_getlevval_r(db.get(), e.value)};
        ASSERT_NE(by_value, nullptr);
        EXPECT_STREQ(by_value->name, e.name);
    }
    LevPtr wrapped{files_getlevval_r(db.get(), 256 + 7)};  // only the low 8 bits count
    ASSERT_NE(wrapped, nullptr);
    EXPECT_STREQ(wrapped->name, "mid");
}

TEST_F(FilesBackend, CategoriesRoundTrip) {
    CatDb db{files_opencatdb_r()};
    ASSERT_NE(db, nullptr);
    catent_t in[] = {{const_cast<char*>("a"), 1},
                     {const_cast<char*>("z"), UINT64_C(1) << 63},
                     {const_cast<char*>("both"), 0x30}};
    for (const catent_t& e : in) ASSERT_EQ(files_putcatent_r(db.get(), &e), 0);
    EXPECT_EQ(read_text(path("categories")), "a:1\nz:8000000000000000\nboth:30\n");

    std::vector<std::string> walked;
    ASSERT_EQ(files_setcatent_r(db.get()), 0);
    while (CatPtr e{files_getcatent_r(db.get())}) walked.push_back(e->name);
    EXPECT_EQ(walked, (std::vector<std::string>{"a", "z", "both"}));

    for (const catent_t& e : in) {
        CatPtr by_value{files_getcatval_r(db.get(), e.value)};
        ASSERT_NE(by_value, nullptr) << e.name;
        EXPECT_STREQ(by_value->name, e.name);
        CatPtr by_name{files_getcatnam_r(db.get(), e.name)};
        ASSERT_NE(by_name, nullptr);
        EXPECT_EQ(by_name->value, e.value);
    }
    errno = 0;
    EXPECT_EQ(files_getcatval_r(db.get(), 0x10), nullptr);  // a value matches whole, not bitwise
    EXPECT_EQ(errno, ENOENT);
}

TEST_F(FilesBackend, UsersRoundTripByNameAndUid) {
    MacDb db{files_openmacdb_r()};
    ASSERT_NE(db, nullptr);
    const macent_t alice{const_cast<char*>("alice"), 3, 0xff, 5, UINT64_C(0xdead00000000beef)};
    const macent_t root{const_cast<char*>("root"), 1, 2, 3, 4};
    ASSERT_EQ(files_putmacent_r(db.get(), &alice), 0);
    ASSERT_EQ(files_putmacent_r(db.get(), &root), 0);
    EXPECT_EQ(read_text(path("users")), "alice:3:ff:5:dead00000000beef\nroot:1:2:3:4\n");

    MacPtr got{files_getmacnam_r(db.get(), "alice")};
    ASSERT_NE(got, nullptr);
    EXPECT_EQ(got->lev1, 3);
    EXPECT_EQ(got->cat1, 0xffu);
    EXPECT_EQ(got->lev2, 5);
    EXPECT_EQ(got->cat2, UINT64_C(0xdead00000000beef));

    MacPtr by_uid{files_getmacuid_r(db.get(), 0)};  // uid 0 is "root" on every system
    ASSERT_NE(by_uid, nullptr);
    EXPECT_STREQ(by_uid->name, "root");
    EXPECT_EQ(by_uid->cat2, 4u);
}

TEST_F(FilesBackend, MissesSetEnoent) {
    MacDb mac{files_openmacdb_r()};
    LevDb lev{files_openlevdb_r()};
    CatDb cat{files_opencatdb_r()};
    ASSERT_TRUE(mac && lev && cat);
    // No files yet: every database is empty.
    ASSERT_EQ(files_setmacent_r(mac.get()), 0);
    EXPECT_EQ(files_getmacent_r(mac.get()), nullptr);

    const macent_t someone{const_cast<char*>("someone"), 0, 0, 0, 0};
    ASSERT_EQ(files_putmacent_r(mac.get(), &someone), 0);
    struct Miss {
        const char* what;
        void* (*call)(void*);
        void* db;
    } misses[] = {
        {"mac name", [](void* d) -> void* { return files_getmacnam_r(d, "nobody-here"); }, mac.get()},
        {"mac uid", [](void* d) -> void* { return files_getmacuid_r(d, 0); }, mac.get()},  // root has no entry
        {"mac unknown uid", [](void* d) -> void* { return files_getmacuid_r(d, 4000000000u); }, mac.get()},
        {"lev name", [](void* d) -> void* { return files_getlevnam_r(d, "x"); }, lev.get()},
        {"lev value", [](void* d) -> void* { return files_getlevval_r(d, 9); }, lev.get()},
        {"cat name", [](void* d) -> void* { return files_getcatnam_r(d, "x"); }, cat.get()},
        {"cat value", [](void* d) -> void* { return files_getcatval_r(d, 4); }, cat.get()},
    };
    for (const Miss& m : misses) {
        errno = 0;
        EXPECT_EQ(m.call(m.db), nullptr) << m.what;
        EXPECT_EQ(errno, ENOENT) << m.what;
    }
}

TEST_F(FilesBackend, PutReplacesInPlaceAndDropsDuplicates) {
    install_text(path("levels"), "# levels\na:1\nb:2\nc:3\n\nb:9\n");
    LevDb db{files_openlevdb_r()};
    ASSERT_NE(db, nullptr);
    LevPtr first{files_getlevnam_r(db.get(), "b")};  // the first of two wins
    ASSERT_NE(first, nullptr);
    EXPECT_EQ(first->value, 2);

    const levent_t b{const_cast<char*>("b"), 20};
    ASSERT_EQ(files_putlevent_r(db.get(), &b), 0);
    EXPECT_EQ(read_text(path("levels")), "# levels\na:1\nb:20\nc:3\n\n");
    EXPECT_EQ(walk_levels(db.get()), (std::vector<std::string>{"a=1", "b=20", "c=3"}));
}

TEST_F(FilesBackend, RemoveByNameAndByValue) {
    install_text(path("levels"), "a:1\nb:2\nc:1\n");
    install_text(path("categories"), "x:1\ny:2\n");
    LevDb lev{files_openlevdb_r()};
    CatDb cat{files_opencatdb_r()};
    ASSERT_TRUE(lev && cat);

    EXPECT_EQ(files_rmlevval_r(lev.get(), 256 + 1), 0);  // every entry of value 1
    EXPECT_EQ(read_text(path("levels")), "b:2\n");
    EXPECT_EQ(files_rmlevnam_r(lev.get(), "b"), 0);
    EXPECT_EQ(read_text(path("levels")), "");
    EXPECT_EQ(files_rmcatval_r(cat.get(), 2), 0);
    EXPECT_EQ(files_rmcatnam_r(cat.get(), "x"), 0);
    EXPECT_EQ(read_text(path("categories")), "");

    struct {
        const char* what;
        int rc;
    } gone[] = {
        {"rmlevnam", files_rmlevnam_r(lev.get(), "b")},
        {"rmlevval", files_rmlevval_r(lev.get(), 1)},
        {"rmcatnam", files_rmcatnam_r(cat.get(), "x")},
        {"rmcatval", files_rmcatval_r(cat.get(), 3)},
    };
    for (const auto& g : gone) EXPECT_EQ(g.rc, -1) << g.what;
    errno = 0;
    EXPECT_EQ(files_rmlevnam_r(lev.get(), "none"), -1);
    EXPECT_EQ(errno, ENOENT);
}

TEST_F(FilesBackend, MalformedLinesAreSkippedOnReadAndRefusedOnWrite) {
    const std::string text = "good:1\nno separator\nbig:256\nalso:2\n";
    install_text(path("levels"), text);
    LevDb db{files_openlevdb_r()};
    ASSERT_NE(db, nullptr);
    EXPECT_EQ(walk_levels(db.get()), (std::vector<std::string>{"good=1", "also=2"}));
    LevPtr also{files_getlevnam_r(db.get(), "also")};
    EXPECT_NE(also, nullptr);

    const levent_t e{const_cast<char*>("new"), 3};
    ::testing::internal::CaptureStderr();
    errno = 0;
    EXPECT_EQ(files_putlevent_r(db.get(), &e), -1);
    EXPECT_EQ(errno, EBADMSG);
    const std::string diag = ::testing::internal::GetCapturedStderr();
    EXPECT_NE(diag.find(path("levels") + ":2:"), std::string::npos) << diag;
    EXPECT_EQ(read_text(path("levels")), text);
}

TEST_F(FilesBackend, UnstorableRecordsAreRefused) {
    LevDb db{files_openlevdb_r()};
    ASSERT_NE(db, nullptr);
    const char* bad_names[] = {"", "a:b", "a b", "tab\tbed", "new\nline", "#hash", " lead"};
    for (const char* name : bad_names) {
        const levent_t e{const_cast<char*>(name), 1};
        errno = 0;
        EXPECT_EQ(files_putlevent_r(db.get(), &e), -1) << name;
        EXPECT_EQ(errno, EINVAL) << name;
    }
    errno = 0;
    EXPECT_EQ(files_putlevent_r(db.get(), nullptr), -1);
    EXPECT_EQ(errno, EINVAL);
    const catent_t no_name{nullptr, 1};
    CatDb cat{files_opencatdb_r()};
    errno = 0;
    EXPECT_EQ(files_putcatent_r(cat.get(), &no_name), -1);
    EXPECT_EQ(errno, EINVAL);
    struct stat st{};
    EXPECT_NE(::stat(path("levels").c_str(), &st), 0) << "nothing may be written";
    EXPECT_NE(::stat(path("categories").c_str(), &st), 0);
}

// libvyr forwards whatever handle it is given, NULL included.
TEST_F(FilesBackend, ForeignHandlesAreRefused) {
    LevDb lev{files_openlevdb_r()};
    ASSERT_NE(lev, nullptr);
    errno = 0;
    EXPECT_EQ(files_getcatnam_r(lev.get(), "x"), nullptr);
    EXPECT_EQ(errno, EINVAL);
    errno = 0;
    EXPECT_EQ(files_setmacent_r(nullptr), -1);
    EXPECT_EQ(errno, EINVAL);
}

TEST_F(FilesBackend, OpenNeedsTheDirectory) {
    std::strcpy(dbroute_cfg.files_dir, (dir_ + "/missing").c_str());
    errno = 0;
    EXPECT_EQ(files_openlevdb_r(), nullptr);
    EXPECT_EQ(errno, ENOENT);
    install_text(path("plain"), "x");
    std::strcpy(dbroute_cfg.files_dir, path("plain").c_str());
    errno = 0;
    EXPECT_EQ(files_opencatdb_r(), nullptr);
    EXPECT_EQ(errno, ENOTDIR);
}

TEST_F(FilesBackend, DirectoryComesFromTheConfigurationFile) {
    const std::string conf = path("dbroute.conf");
    install_text(conf, "lev_backend = files\nfiles_dir = " + dir_ + "/sub\n");
    ASSERT_EQ(::mkdir((dir_ + "/sub").c_str(), 0755), 0);
    std::memset(dbroute_cfg.files_dir, 0, sizeof dbroute_cfg.files_dir);
    ::setenv("VYR_DBROUTE_CONF", conf.c_str(), 1);
    ASSERT_EQ(dbroute_init(), 0);
    ::unsetenv("VYR_DBROUTE_CONF");
    LevDb db{files_openlevdb_r()};
    ASSERT_NE(db, nullptr);
    const levent_t e{const_cast<char*>("l"), 4};
    ASSERT_EQ(files_putlevent_r(db.get(), &e), 0);
    EXPECT_EQ(read_text(dir_ + "/sub/levels"), "l:4\n");
}

TEST_F(FilesBackend, WalkKeepsItsVersionWhileLookupsSeeTheNewFile) {
    install_text(path("levels"), "a:1\nb:2\n");
    LevDb db{files_openlevdb_r()};
    ASSERT_NE(db, nullptr);
    ASSERT_EQ(files_setlevent_r(db.get()), 0);
    LevPtr first{files_getlevent_r(db.get())};
    ASSERT_NE(first, nullptr);
    EXPECT_STREQ(first->name, "a");

    install_text(path("levels"), "c:3\n");
    LevPtr second{files_getlevent_r(db.get())};
    ASSERT_NE(second, nullptr);
    EXPECT_STREQ(second->name, "b");
    EXPECT_EQ(files_getlevent_r(db.get()), nullptr);

    LevPtr fresh{files_getlevnam_r(db.get(), "c")};  // lookups follow the file at once
    EXPECT_NE(fresh, nullptr);
    EXPECT_EQ(files_getlevnam_r(db.get(), "a"), nullptr);
    EXPECT_EQ(walk_levels(db.get()), (std::vector<std::string>{"c=3"}));
}

// A parse is reused exactly while device, inode, size and nanosecond
// modification time stay the same. Each case changes the file behind the
// cache's back and says whether a lookup must see the change.
TEST_F(FilesBackend, CachedParseFollowsFileIdentity) {
    struct Case {
        const char* what;
        bool keep_size;
        long mtime_shift_ns;
        bool new_inode;
        bool seen;
    } cases[] = {
        {"same size and time, in place", true, 0, false, false},  // indistinguishable: cached
        {"size changes", false, 0, false, true},
        {"time moves by 1 ns", true, 1, false, true},
        {"new inode, same size and time", true, 0, true, true},
    };
    for (const Case& c : cases) {
        install_text(path("levels"), "aa:1\n");
        LevDb db{files_openlevdb_r()};
        ASSERT_NE(db, nullptr);
        ASSERT_NE(LevPtr(files_getlevnam_r(db.get(), "aa")), nullptr) << c.what;  // parsed and cached

        struct stat before{};
        ASSERT_EQ(::stat(path("levels").c_str(), &before), 0);
        const std::string text = c.keep_size ? "bb:2\n" : "bbb:2\n";
        if (c.new_inode) {
            install_text(path("levels"), text);
        } else {
            std::ofstream(path("levels"), std::ios::in | std::ios::out) << text;
        }
        struct timespec times[2] = {before.st_atim, before.st_mtim};
        times[1].tv_nsec += c.mtime_shift_ns;
        if (times[1].tv_nsec >= 1'000'000'000) {
            times[1].tv_nsec -= 1'000'000'000;
            ++times[1].tv_sec;
        }
        ASSERT_EQ(::utimensat(AT_FDCWD, path("levels").c_str(), times, 0), 0);

        LevPtr b{files_getlevnam_r(db.get(), c.keep_size ? "bb" : "bbb")};
        EXPECT_EQ(b != nullptr, c.seen) << c.what;
    }
}

TEST_F(FilesBackend, WritesKeepTheFileMode) {
    LevDb db{files_openlevdb_r()};
    const levent_t a{const_cast<char*>("a"), 1};
    ASSERT_EQ(files_putlevent_r(db.get(), &a), 0);
    struct stat st{};
    ASSERT_EQ(::stat(path("levels").c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0644u);
    ASSERT_EQ(::chmod(path("levels").c_str(), 0640), 0);
    const levent_t b{const_cast<char*>("b"), 2};
    ASSERT_EQ(files_putlevent_r(db.get(), &b), 0);
    ASSERT_EQ(::stat(path("levels").c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0640u);
    EXPECT_EQ(stray_files(), "");
}

// ---- allocation failure: results say so, nothing leaks, files stay whole ----

TEST_F(FilesBackend, PutUnderAllocationFailure) {
    const std::string before = "# users\nbob:1:1:1:1\n";
    const macent_t carol{const_cast<char*>("carol"), 2, 0xa, 3, 0xb};
    int refused = 0;
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector& inj) {
        install_text(path("users"), before);
        const int rc = inj.run([&] {
            void* db = files_openmacdb_r();
            if (db == nullptr) return -2;
            const int r = files_putmacent_r(db, &carol);
            files_closemacdb_r(db);
            return r;
        });
        const int err = errno;
        // Removing leftovers of killed writers is best effort: a failure
        // there does not stop the write.
        if (inj.fired() && rc != 0) {
            ++refused;
            EXPECT_EQ(err, ENOMEM);
            EXPECT_EQ(read_text(path("users")), before);
            return;
        }
        EXPECT_EQ(rc, 0);
        EXPECT_EQ(read_text(path("users")), before + "carol:2:a:3:b\n");
    });
    // Under a sanitizer `new` does not reach malloc, and only the plain C
    // allocations can be failed; those are all best effort on this path.
    if (new_reaches_malloc()) {
        EXPECT_GT(refused, 3);
    }
    EXPECT_EQ(stray_files(), "");
}

TEST_F(FilesBackend, LookupsAndWalksUnderAllocationFailure) {
    install_text(path("categories"), "a:1\nb:2\nc:4\n");
    {
        CatDb warm{files_opencatdb_r()};  // parse once outside the sweep: the cache outlives it
        CatPtr e{files_getcatnam_r(warm.get(), "a")};
        ASSERT_NE(e, nullptr);
    }
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector& inj) {
        std::string seen;
        const bool ok = inj.run([&] {
            void* db = files_opencatdb_r();
            if (db == nullptr) return false;
            bool good = true;
            if (catent_t* e = files_getcatval_r(db, 2)) {
                seen += e->name;
                std::free(e->name);
                std::free(e);
            } else {
                good = false;
            }
            if (files_setcatent_r(db) != 0) good = false;
            while (catent_t* e = files_getcatent_r(db)) {
                seen += e->name;
                std::free(e->name);
                std::free(e);
            }
            files_closecatdb_r(db);
            return good;
        });
        if (inj.fired()) {
            EXPECT_EQ(errno, ENOMEM);
            return;
        }
        EXPECT_TRUE(ok);
        EXPECT_EQ(seen, "babc");
    });
}

}  // namespace
