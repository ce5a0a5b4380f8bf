// The files back-end through its exported entries: round trips, walk order,
// replace and remove semantics, misses, bad input, caching, and allocation
// failure.
#include <fcntl.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdint>
#include <new>
#include <string>

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

// Puts, the file they write, the walk in file order, and lookups by name and
// by value: levels by their low 8 bits, categories and users whole.
TEST_F(FilesBackend, RoundTrips) {
    MacDb mac{files_openmacdb_r()};
    LevDb lev{files_openlevdb_r()};
    CatDb cat{files_opencatdb_r()};
    ASSERT_TRUE(mac && lev && cat);
    const levent_t levs[] = {{const_cast<char*>("low"), 0}, {const_cast<char*>("top"), 255}};
    const catent_t cats[] = {{const_cast<char*>("z"), UINT64_C(1) << 63}, {const_cast<char*>("both"), 0x30}};
    const macent_t users[] = {{const_cast<char*>("alice"), 3, 0xff, 5, UINT64_C(0xdead00000000beef)},
                              {const_cast<char*>("root"), 1, 2, 3, 4}};
    for (const auto& e : levs) ASSERT_EQ(files_putlevent_r(lev.get(), &e), 0);
    for (const auto& e : cats) ASSERT_EQ(files_putcatent_r(cat.get(), &e), 0);
    for (const auto& e : users) ASSERT_EQ(files_putmacent_r(mac.get(), &e), 0);
    EXPECT_EQ(read_text(path("levels")), "low:0\ntop:255\n");
    EXPECT_EQ(read_text(path("categories")), "z:8000000000000000\nboth:30\n");
    EXPECT_EQ(read_text(path("users")), "alice:3:ff:5:dead00000000beef\nroot:1:2:3:4\n");

    EXPECT_EQ(walk(lev.get(), files_setlevent_r, files_getlevent_r), "low:0\ntop:255\n");
    EXPECT_EQ(walk(cat.get(), files_setcatent_r, files_getcatent_r), "z:9223372036854775808\nboth:48\n");
    EXPECT_EQ(walk(mac.get(), files_setmacent_r, files_getmacent_r),
              "alice:3:255:5:16045481047390994159\nroot:1:2:3:4\n");
    EXPECT_EQ(take(files_getlevnam_r(lev.get(), "top")), "top:255");
    EXPECT_EQ(take(files_getlevval_r(lev.get(), 256 + 255)), "top:255");
    EXPECT_EQ(take(files_getcatnam_r(cat.get(), "both")), "both:48");
    EXPECT_EQ(take(files_getcatval_r(cat.get(), 0x30)), "both:48");
    EXPECT_EQ(take(files_getmacnam_r(mac.get(), "alice")), "alice:3:255:5:16045481047390994159");
    EXPECT_EQ(take(files_getmacuid_r(mac.get(), 0)), "root:1:2:3:4");  // uid 0 is "root" on every system
}

TEST_F(FilesBackend, MissesSetEnoent) {
    MacDb mac{files_openmacdb_r()};
    LevDb lev{files_openlevdb_r()};
    CatDb cat{files_opencatdb_r()};
    ASSERT_TRUE(mac && lev && cat);
    EXPECT_EQ(walk(mac.get(), files_setmacent_r, files_getmacent_r), "") << "no file: an empty database";
    install_text(path("users"), "someone:0:0:0:0\n");
    install_text(path("categories"), "both:30\n");
    EXPECT_TRUE(failed_with(files_getmacnam_r(mac.get(), "nobody-here") == nullptr, ENOENT));
    EXPECT_TRUE(failed_with(files_getmacuid_r(mac.get(), 0) == nullptr, ENOENT));  // root has no entry
    EXPECT_TRUE(failed_with(files_getmacuid_r(mac.get(), 4000000000u) == nullptr, ENOENT));  // nor a user
    EXPECT_TRUE(failed_with(files_getlevnam_r(lev.get(), "x") == nullptr, ENOENT));
    EXPECT_TRUE(failed_with(files_getlevval_r(lev.get(), 9) == nullptr, ENOENT));
    EXPECT_TRUE(failed_with(files_getcatval_r(cat.get(), 0x10) == nullptr, ENOENT)) << "values match whole";
}

TEST_F(FilesBackend, PutReplacesInPlaceAndDropsDuplicates) {
    install_text(path("levels"), "# levels\na:1\nb:2\nc:3\n\nb:9\n");
    LevDb db{files_openlevdb_r()};
    ASSERT_NE(db, nullptr);
    EXPECT_EQ(take(files_getlevnam_r(db.get(), "b")), "b:2") << "the first of two wins";
    const levent_t b{const_cast<char*>("b"), 20};
    ASSERT_EQ(files_putlevent_r(db.get(), &b), 0);
    EXPECT_EQ(read_text(path("levels")), "# levels\na:1\nb:20\nc:3\n\n");
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
    EXPECT_EQ(files_rmcatval_r(cat.get(), 2), 0);
    EXPECT_EQ(files_rmcatnam_r(cat.get(), "x"), 0);
    EXPECT_EQ(read_text(path("levels")) + read_text(path("categories")), "");
    EXPECT_TRUE(failed_with(files_rmlevnam_r(lev.get(), "b") == -1, ENOENT));
    EXPECT_TRUE(failed_with(files_rmlevval_r(lev.get(), 1) == -1, ENOENT));
    EXPECT_TRUE(failed_with(files_rmcatnam_r(cat.get(), "x") == -1, ENOENT));
    EXPECT_TRUE(failed_with(files_rmcatval_r(cat.get(), 3) == -1, ENOENT));
}

TEST_F(FilesBackend, MalformedLinesAreSkippedOnReadAndRefusedOnWrite) {
    const std::string text = "good:1\nno separator\nbig:256\nalso:2\n";
    install_text(path("levels"), text);
    LevDb db{files_openlevdb_r()};
    ASSERT_NE(db, nullptr);
    EXPECT_EQ(walk(db.get(), files_setlevent_r, files_getlevent_r), "good:1\nalso:2\n");
    EXPECT_EQ(take(files_getlevnam_r(db.get(), "also")), "also:2");

    const levent_t e{const_cast<char*>("new"), 3};
    ::testing::internal::CaptureStderr();
    EXPECT_TRUE(failed_with(files_putlevent_r(db.get(), &e) == -1, EBADMSG));
    const std::string diag = ::testing::internal::GetCapturedStderr();
    EXPECT_NE(diag.find(path("levels") + ":2:"), std::string::npos) << diag;
    EXPECT_EQ(read_text(path("levels")), text);
}

// Bad records and handles are refused before anything is written. The rules
// for names are the line writer's (files_lines_test); here only that they
// reach the entry.
TEST_F(FilesBackend, BadInputIsRefused) {
    LevDb lev{files_openlevdb_r()};
    CatDb cat{files_opencatdb_r()};
    ASSERT_TRUE(lev && cat);
    const levent_t blank{const_cast<char*>("a b"), 1};
    const catent_t no_name{nullptr, 1};
    EXPECT_TRUE(failed_with(files_putlevent_r(lev.get(), &blank) == -1, EINVAL));
    EXPECT_TRUE(failed_with(files_putlevent_r(lev.get(), nullptr) == -1, EINVAL));
    EXPECT_TRUE(failed_with(files_putcatent_r(cat.get(), &no_name) == -1, EINVAL));
    // libvyr forwards whatever handle it is given, NULL included.
    EXPECT_TRUE(failed_with(files_getcatnam_r(lev.get(), "x") == nullptr, EINVAL));
    EXPECT_TRUE(failed_with(files_setmacent_r(nullptr) == -1, EINVAL));
    EXPECT_EQ(stray_files() + read_text(path("levels")) + read_text(path("categories")), "");

    set_files_dir(dir_ / "missing");
    EXPECT_TRUE(failed_with(files_openlevdb_r() == nullptr, ENOENT));
    install_text(path("plain"), "x");
    set_files_dir(path("plain"));
    EXPECT_TRUE(failed_with(files_opencatdb_r() == nullptr, ENOTDIR));
}

TEST_F(FilesBackend, WalkKeepsItsVersionWhileLookupsSeeTheNewFile) {
    install_text(path("levels"), "a:1\nb:2\n");
    LevDb db{files_openlevdb_r()};
    ASSERT_NE(db, nullptr);
    ASSERT_EQ(files_setlevent_r(db.get()), 0);
    EXPECT_EQ(take(files_getlevent_r(db.get())), "a:1");
    install_text(path("levels"), "c:3\n");
    EXPECT_EQ(take(files_getlevent_r(db.get())), "b:2");
    EXPECT_EQ(files_getlevent_r(db.get()), nullptr);
    EXPECT_EQ(take(files_getlevnam_r(db.get(), "c")), "c:3") << "lookups follow the file at once";
    EXPECT_EQ(walk(db.get(), files_setlevent_r, files_getlevent_r), "c:3\n");
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
        ASSERT_EQ(take(files_getlevnam_r(db.get(), "aa")), "aa:1") << c.what;  // parsed and cached

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
        EXPECT_EQ(take(files_getlevnam_r(db.get(), c.keep_size ? "bb" : "bbb")) != "null", c.seen) << c.what;
    }
}

// A replacement keeps the mode of the file it replaces, and is always newer
// than it, even when the clock is behind: a cached parse must never match it.
TEST_F(FilesBackend, WritesKeepTheModeAndMoveTheTimeForward) {
    LevDb db{files_openlevdb_r()};
    const levent_t a{const_cast<char*>("a"), 1};
    ASSERT_EQ(files_putlevent_r(db.get(), &a), 0);
    struct stat st{};
    ASSERT_EQ(::stat(path("levels").c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0644u);
    ASSERT_EQ(::chmod(path("levels").c_str(), 0640), 0);
    const struct timespec future[2] = {{0, UTIME_OMIT}, {st.st_mtim.tv_sec + 3600, 0}};
    ASSERT_EQ(::utimensat(AT_FDCWD, path("levels").c_str(), future, 0), 0);
    ASSERT_EQ(files_putlevent_r(db.get(), &a), 0);
    ASSERT_EQ(::stat(path("levels").c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0640u);
    EXPECT_GT(st.st_mtim.tv_sec * 1'000'000'000LL + st.st_mtim.tv_nsec, future[1].tv_sec * 1'000'000'000LL);
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
            MacDb db{files_openmacdb_r()};
            return db ? files_putmacent_r(db.get(), &carol) : -2;
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
        ASSERT_EQ(take(files_getcatnam_r(warm.get(), "a")), "a:1");
    }
    // Only the entries run under the failing allocator; the results are
    // rendered after it.
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector& inj) {
        catent_t* got[5] = {};
        int set = -1;
        inj.run([&] {
            CatDb db{files_opencatdb_r()};
            if (!db) return;
            got[0] = files_getcatval_r(db.get(), 2);
            set = files_setcatent_r(db.get());
            for (int i = 1; i < 5 && (got[i] = files_getcatent_r(db.get())) != nullptr; ++i) {
            }
        });
        const int err = errno;
        std::string seen;
        for (catent_t* e : got) seen += take(e) + " ";
        if (inj.fired()) {
            EXPECT_EQ(err, ENOMEM);
            return;
        }
        EXPECT_EQ(set, 0);
        EXPECT_EQ(seen, "b:2 a:1 b:2 c:4 null ");
    });
}

}  // namespace
