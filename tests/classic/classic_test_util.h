// Helpers shared by the classic interface tests.
#pragma once

#include <vyr/classic.h>

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <unistd.h>

namespace classic_test {

struct MacDeleter {
    void operator()(mac_t *m) const { mac_free(m); }
};
using Mac = std::unique_ptr<mac_t, MacDeleter>;

struct FreeDeleter {
    void operator()(void *p) const { std::free(p); }
};
using Text = std::unique_ptr<char, FreeDeleter>;

inline Mac make(unsigned lev, uint64_t cat, uint32_t type) {
    Mac m{mac_init(type)};
    EXPECT_NE(m, nullptr);
    if (m) {
        m->lev = static_cast<uint8_t>(lev);
        m->cat = cat;
    }
    return m;
}

// Points the name databases at a configuration holding `body`, before the
// first database call of the process.  The file lives in the build tree and
// stays there: the databases read it again whenever a start-up is retried.
inline void use_db_config(const std::string &tag, const std::string &body) {
    const char *dir = std::getenv("VYR_TEST_BUILD_DIR");
    // One file per process: tests of one program run side by side.
    std::string path = std::string(dir ? dir : "/tmp") + "/classic-" + tag + "-" + std::to_string(::getpid()) + ".conf";
    std::FILE *f = std::fopen(path.c_str(), "w");
    ASSERT_NE(f, nullptr) << path;
    std::fputs(body.c_str(), f);
    std::fclose(f);
    ::setenv("VYR_DBROUTE_CONF", path.c_str(), 1);
}

// Starts the level and category databases, whose one-time start-up (the
// configuration read, the plug-in load) keeps memory for the life of the
// process: allocation sweeps must begin after it.
inline void start_databases() {
    Mac m = make(0, 1, 0);
    std::free(mac_to_text(m.get(), nullptr, MAC_TEXT_NAMES | MAC_TEXT_LEV | MAC_TEXT_CAT));
    mac_from_text(m.get(), "0:1");
}

}  // namespace classic_test
