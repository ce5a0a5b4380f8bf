// The files back-end through its exported entries, in one process and in
// several writing at once, killed, or failing part way.
#include <fcntl.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <iterator>
#include <memory>
#include <new>
#include <random>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "contract/backend.h"
#include "contract/dbroute.h"
#include "support/entries.hh"
#include "support/failalloc.h"
#include "support/scratch_dir.hh"

extern "C" {
VYR_BACKEND_DECLARE(files)
}

namespace {

using vyr_test::failed_with;
using vyr_test::take;

template <int (*Close)(void*)>
using Db = std::unique_ptr<void, decltype([](void* h) { Close(h); })>;
using MacDb = Db<files_closemacdb_r>;
using LevDb = Db<files_closelevdb_r>;
using CatDb = Db<files_closecatdb_r>;

// Every entry of a walk, one take() per line.
template <class Rec>
std::string walk(void* db, int (*set)(void*), Rec* (*next)(void*)) {
    std::string out = set(db) == 0 ? "" : "set failed\n";
    while (Rec* e = next(db)) out += take(e) + "\n";
    return out;
}

std::string read_text(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

// Replaces a file as an editor would: new file, rename.
void install_text(const std::string& path, const std::string& text) {
    std::ofstream(path + ".edit", std::ios::binary) << text;
    ASSERT_EQ(::rename((path + ".edit").c_str(), path.c_str()), 0);
}

// Adds one user through a fresh handle, as a separate program would; 0 or errno.
int add_user(const std::string& name) {
    MacDb db{files_openmacdb_r()};
    if (!db) return errno;
    const macent_t e{const_cast<char*>(name.c_str()), 1, 0x2, 3, 0x4};
    return files_putmacent_r(db.get(), &e) == 0 ? 0 : errno;
}

// Runs fn in a child process whose exit status is fn's result.
template <class F>
pid_t spawn(F&& fn) {
    const pid_t pid = ::fork();
    if (pid == 0) ::_exit(fn());
    return pid;
}

int wait_exit(pid_t pid) {
    int status = 0;
    return ::waitpid(pid, &status, 0) == pid && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

// A users file of n lines "<prefix><i>:1:2:3:4", as add_user writes them.
std::string users(const std::string& prefix, int n) {
    std::string out;
    for (int i = 0; i < n; ++i) out += prefix + std::to_string(i) + ":1:2:3:4\n";
    return out;
}

class Files : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(dir_.ok());
        set_files_dir(dir_.path());
    }
    void TearDown() override { ::chmod(dir_.path().c_str(), 0755); }
    static void set_files_dir(const std::string& dir) {
        std::memset(dbroute_cfg.files_dir, 0, sizeof dbroute_cfg.files_dir);
        dir.copy(dbroute_cfg.files_dir, sizeof dbroute_cfg.files_dir - 1);
    }
    std::string path(const char* file) const { return dir_ / file; }
    // Names other than the databases and their locks: leftovers of a write.
    std::string stray_files() const {
        std::string out;
        if (FILE* p = ::popen(("ls -A '" + dir_.path() + "' | grep -v -x -E '(users|levels|categories)(\\.lock)?'").c_str(), "r")) {
            for (char buf[256]; std::fgets(buf, sizeof buf, p) != nullptr;) out += buf;
            ::pclose(p);
        }
        return out;
    }
    vyr_test::ScratchDir dir_;
};

// Puts, the file they write, the walk in file order, lookups by name and by
// value (levels by their low 8 bits, the rest whole), and misses.
TEST_F(Files, RoundTripsAndMisses) {
    MacDb mac{files_openmacdb_r()};
    LevDb lev{files_openlevdb_r()};
    CatDb cat{files_opencatdb_r()};
    ASSERT_TRUE(mac && lev && cat);
    EXPECT_EQ(walk(mac.get(), files_setmacent_r, files_getmacent_r), "") << "no file: an empty database";
    const levent_t levs[] = {{const_cast<char*>("low"), 0}, {const_cast<char*>("top"), 255}};
    const catent_t cats[] = {{const_cast<char*>("z"), UINT64_C(1) << 63}, {const_cast<char*>("both"), 0x30}};
    const macent_t users[] = {{const_cast<char*>("alice"), 3, 0xff, 5, UINT64_C(0xdead00000000beef)}};
    for (const auto& e : levs) ASSERT_EQ(files_putlevent_r(lev.get(), &e), 0);
    for (const auto& e : cats) ASSERT_EQ(files_putcatent_r(cat.get(), &e), 0);
    ASSERT_EQ(files_putmacent_r(mac.get(), users), 0);
    EXPECT_EQ(read_text(path("levels")) + read_text(path("categories")) + read_text(path("users")),
              "low:0\ntop:255\nz:8000000000000000\nboth:30\nalice:3:ff:5:dead00000000beef\n");
    EXPECT_EQ(walk(lev.get(), files_setlevent_r, files_getlevent_r), "low:0\ntop:255\n");
    EXPECT_EQ(walk(cat.get(), files_setcatent_r, files_getcatent_r), "z:9223372036854775808\nboth:48\n");
    EXPECT_EQ(walk(mac.get(), files_setmacent_r, files_getmacent_r), "alice:3:255:5:16045481047390994159\n");
    EXPECT_EQ(take(files_getlevnam_r(lev.get(), "top")), "top:255");
    EXPECT_EQ(take(files_getlevval_r(lev.get(), 256 + 255)), "top:255");
    EXPECT_EQ(take(files_getcatnam_r(cat.get(), "both")), "both:48");
    EXPECT_EQ(take(files_getcatval_r(cat.get(), 0x30)), "both:48");
    EXPECT_EQ(take(files_getmacnam_r(mac.get(), "alice")), "alice:3:255:5:16045481047390994159");
    EXPECT_TRUE(failed_with(files_getmacuid_r(mac.get(), 0) == nullptr, ENOENT)) << "root has no entry yet";
    const macent_t root{const_cast<char*>("root"), 1, 2, 3, 4};
    ASSERT_EQ(files_putmacent_r(mac.get(), &root), 0);
    EXPECT_EQ(take(files_getmacuid_r(mac.get(), 0)), "root:1:2:3:4");  // uid 0 is "root" on every system
    EXPECT_TRUE(failed_with(files_getmacuid_r(mac.get(), 4000000000u) == nullptr, ENOENT)) << "no such user";
    EXPECT_TRUE(failed_with(files_getmacnam_r(mac.get(), "nobody") == nullptr, ENOENT));
    EXPECT_TRUE(failed_with(files_getlevval_r(lev.get(), 9) == nullptr, ENOENT));
    EXPECT_TRUE(failed_with(files_getcatval_r(cat.get(), 0x10) == nullptr, ENOENT)) << "values match whole";
}

TEST_F(Files, PutReplacesAndRemoveDeletesEveryMatch) {
    install_text(path("levels"), "# levels\na:1\nb:2\nc:1\n\nb:9\n");
    LevDb db{files_openlevdb_r()};
    EXPECT_EQ(take(files_getlevnam_r(db.get(), "b")), "b:2") << "the first of two wins";
    const levent_t b{const_cast<char*>("b"), 20};
    ASSERT_EQ(files_putlevent_r(db.get(), &b), 0);
    EXPECT_EQ(read_text(path("levels")), "# levels\na:1\nb:20\nc:1\n\n") << "in place, duplicate dropped";
    EXPECT_EQ(files_rmlevval_r(db.get(), 256 + 1), 0);
    EXPECT_EQ(files_rmlevnam_r(db.get(), "b"), 0);
    EXPECT_EQ(read_text(path("levels")), "# levels\n\n");
    EXPECT_TRUE(failed_with(files_rmlevnam_r(db.get(), "b") == -1, ENOENT));
    EXPECT_TRUE(failed_with(files_rmlevval_r(db.get(), 1) == -1, ENOENT));
    install_text(path("categories"), "x:1\ny:2\n");
    CatDb cat{files_opencatdb_r()};
    EXPECT_EQ(files_rmcatval_r(cat.get(), 2) + files_rmcatnam_r(cat.get(), "x"), 0);
    EXPECT_TRUE(failed_with(files_rmcatval_r(cat.get(), 3) == -1, ENOENT));
    EXPECT_EQ(read_text(path("categories")), "");
}

// Bad records and handles, and a file with a malformed line (which readers
// skip), are refused before anything is written.
TEST_F(Files, RefusedWritesLeaveTheFileAlone) {
    const std::string text = "good:1\nno separator\nbig:256\nalso:2\n";
    install_text(path("levels"), text);
    LevDb lev{files_openlevdb_r()};
    CatDb cat{files_opencatdb_r()};
    EXPECT_EQ(walk(lev.get(), files_setlevent_r, files_getlevent_r), "good:1\nalso:2\n");
    EXPECT_EQ(take(files_getlevnam_r(lev.get(), "also")), "also:2");
    const levent_t e{const_cast<char*>("new"), 3}, blank{const_cast<char*>("a b"), 1};
    const catent_t no_name{nullptr, 1};
    ::testing::internal::CaptureStderr();
    EXPECT_TRUE(failed_with(files_putlevent_r(lev.get(), &e) == -1, EBADMSG));
    const std::string diag = ::testing::internal::GetCapturedStderr();
    EXPECT_NE(diag.find(path("levels") + ":2:"), std::string::npos) << diag;
    EXPECT_TRUE(failed_with(files_putlevent_r(lev.get(), &blank) == -1, EINVAL));
    EXPECT_TRUE(failed_with(files_putlevent_r(lev.get(), nullptr) == -1, EINVAL));
    EXPECT_TRUE(failed_with(files_putcatent_r(cat.get(), &no_name) == -1, EINVAL));
    EXPECT_TRUE(failed_with(files_getcatnam_r(lev.get(), "x") == nullptr, EINVAL)) << "another database's handle";
    EXPECT_TRUE(failed_with(files_setmacent_r(nullptr) == -1, EINVAL));
    EXPECT_EQ(stray_files() + read_text(path("levels")) + read_text(path("categories")), text);
    set_files_dir(dir_ / "missing");
    EXPECT_TRUE(failed_with(files_openlevdb_r() == nullptr, ENOENT));
    set_files_dir(path("levels"));
    EXPECT_TRUE(failed_with(files_opencatdb_r() == nullptr, ENOTDIR));
}

TEST_F(Files, WalkKeepsItsVersionWhileLookupsSeeTheNewFile) {
    install_text(path("levels"), "a:1\nb:2\n");
    LevDb db{files_openlevdb_r()};
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
TEST_F(Files, CachedParseFollowsFileIdentity) {
    const struct {
        const char* what;
        bool keep_size, new_inode, seen;
        long mtime_shift_ns;
    } cases[] = {
        {"same size and time, in place", true, false, false, 0},  // indistinguishable: cached
        {"size changes", false, false, true, 0},
        {"time moves by 1 ns", true, false, true, 1},
        {"new inode, same size and time", true, true, true, 0},
    };
    for (const auto& c : cases) {
        install_text(path("levels"), "aa:1\n");
        LevDb db{files_openlevdb_r()};
        ASSERT_EQ(take(files_getlevnam_r(db.get(), "aa")), "aa:1") << c.what;  // parsed and cached
        struct stat before{};
        ASSERT_EQ(::stat(path("levels").c_str(), &before), 0);
        const std::string text = c.keep_size ? "bb:2\n" : "bbb:2\n";
        if (c.new_inode) install_text(path("levels"), text);
        else std::ofstream(path("levels"), std::ios::in | std::ios::out) << text;
        struct timespec times[2] = {before.st_atim, before.st_mtim};
        if ((times[1].tv_nsec += c.mtime_shift_ns) >= 1'000'000'000) times[1] = {times[1].tv_sec + 1, 0};
        ASSERT_EQ(::utimensat(AT_FDCWD, path("levels").c_str(), times, 0), 0);
        EXPECT_EQ(take(files_getlevnam_r(db.get(), c.keep_size ? "bb" : "bbb")) != "null", c.seen) << c.what;
    }
}

// A replacement keeps the mode of the file it replaces and is always newer
// than it, even when the clock is behind: a cached parse must never match it.
TEST_F(Files, WritesKeepTheModeAndMoveTheTimeForward) {
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

// A failed put says ENOMEM and leaves the old file whole and no leftovers.
TEST_F(Files, PutUnderAllocationFailure) {
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
        refused += rc != 0;  // clearing leftovers is best effort: a failure there is no failed put
        EXPECT_EQ(rc == 0 ? 0 : err, rc == 0 || !inj.fired() ? 0 : ENOMEM);
        EXPECT_EQ(read_text(path("users")), before + (rc == 0 ? "carol:2:a:3:b\n" : ""));
    });
    // Under a sanitizer `new` does not reach malloc and no failure can be seen.
    vyr_test::Injector probe(1);
    try {
        probe.run([] { delete new char('x'); });
    } catch (const std::bad_alloc&) {
        EXPECT_GT(refused, 3);
    }
    EXPECT_EQ(stray_files(), "");
}

TEST_F(Files, LookupsAndWalksUnderAllocationFailure) {
    install_text(path("categories"), "a:1\nb:2\nc:4\n");
    {
        CatDb warm{files_opencatdb_r()};  // parse once outside the sweep: the cache outlives it
        ASSERT_EQ(take(files_getcatnam_r(warm.get(), "a")), "a:1");
    }
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector& inj) {
        catent_t* got[5] = {};
        int set = -1;
        inj.run([&] {
            CatDb db{files_opencatdb_r()};
            got[0] = db ? files_getcatval_r(db.get(), 2) : nullptr;
            set = db ? files_setcatent_r(db.get()) : -1;
            for (int i = 1; set == 0 && i < 5 && (got[i] = files_getcatent_r(db.get())) != nullptr; ++i) {
            }
        });
        const int err = errno;
        std::string seen;
        for (catent_t* e : got) seen += take(e) + " ";
        EXPECT_EQ(inj.fired() ? err : set, inj.fired() ? ENOMEM : 0);
        if (!inj.fired()) { EXPECT_EQ(seen, "b:2 a:1 b:2 c:4 null "); }
    });
}

// ---- several processes ----

TEST_F(Files, EightConcurrentWritersLoseNothing) {
    constexpr int kWriters = 8, kEach = 100;
    int gate[2];
    ASSERT_EQ(::pipe(gate), 0);
    std::vector<pid_t> pids;
    for (int w = 0; w < kWriters; ++w) {
        pids.push_back(spawn([&, w] {
            ::close(gate[1]);
            char c;
            if (::read(gate[0], &c, 1) != 0) return 100;  // wait until all are ready
            for (int i = 0; i < kEach; ++i)
                if (const int err = add_user("w" + std::to_string(w) + "-" + std::to_string(i))) return err;
            return 0;
        }));
        ASSERT_GT(pids.back(), 0);
    }
    ::close(gate[0]);
    ::close(gate[1]);  // start them all at once
    for (pid_t pid : pids) EXPECT_EQ(wait_exit(pid), 0);
    std::string mine[kWriters];  // each writer's entries all there, once, in its order
    std::istringstream in(read_text(path("users")));
    for (std::string l; std::getline(in, l);) mine[std::stoi(l.substr(1))] += l + "\n";
    for (int w = 0; w < kWriters; ++w) EXPECT_EQ(mine[w], users("w" + std::to_string(w) + "-", kEach));
}

TEST_F(Files, KilledWriterLeavesOldOrNewFile) {
    install_text(path("users"), users("base", 20000));  // large: each rewrite can be interrupted
    std::mt19937 rng(12345);
    std::uniform_int_distribution<int> delay_us(500, 40000);
    int mid_write = 0;  // rounds in which the writer died between create and rename
    for (int round = 0; round < 12; ++round) {
        const std::string start = read_text(path("users"));
        const std::string tag = "r" + std::to_string(round) + "k";
        const pid_t pid = spawn([&] {
            for (int i = 0;; ++i)
                if (add_user(tag + std::to_string(i)) != 0) return 1;
        });
        ASSERT_GT(pid, 0);
        ::usleep(static_cast<useconds_t>(delay_us(rng)));
        ::kill(pid, SIGKILL);
        ASSERT_EQ(wait_exit(pid), -1) << "writer stopped on its own";
        mid_write += !stray_files().empty();
        // The old content plus whole entries added in order, nothing torn.
        const std::string now = read_text(path("users"));
        ASSERT_EQ(now.compare(0, start.size(), start), 0) << "round " << round;
        const std::string added = now.substr(start.size());
        ASSERT_EQ(added, users(tag, static_cast<int>(std::count(added.begin(), added.end(), '\n'))));
    }
    RecordProperty("killed_mid_write", mid_write);
    ASSERT_EQ(add_user("after"), 0);
    EXPECT_EQ(stray_files(), "") << "the next write clears what killed writers left";
}

// A write that fails part way (file size limit) or cannot start (directory
// not writable) keeps the old file and leaves nothing behind.
TEST_F(Files, FailedWritesKeepTheOldFile) {
    const std::string base = users("u", 200);
    install_text(path("users"), base);
    EXPECT_EQ(wait_exit(spawn([] {
                  ::signal(SIGXFSZ, SIG_IGN);
                  const struct rlimit small{1024, 1024};
                  return ::setrlimit(RLIMIT_FSIZE, &small) != 0 ? 100 : add_user("late");
              })),
              EFBIG);
    EXPECT_EQ(read_text(path("users")), base);
    ASSERT_EQ(::chmod(dir_.path().c_str(), 0555), 0);
    const int status = wait_exit(spawn([] {
        // Root ignores directory permissions: write as an ordinary user.
        if (::geteuid() == 0 && (::setgid(65534) != 0 || ::setuid(65534) != 0)) return 100;
        const int err = add_user("late");
        MacDb db{files_openmacdb_r()};
        return take(files_getmacnam_r(db.get(), "u0")) == "u0:1:2:3:4" ? err : 101;  // reading still works
    }));
    EXPECT_TRUE(status == EACCES || status == 100) << status;  // 100: could not drop root
    EXPECT_EQ(read_text(path("users")), base);
    EXPECT_EQ(stray_files(), "");
}

}  // namespace
