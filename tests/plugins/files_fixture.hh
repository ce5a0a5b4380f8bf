// Shared set-up of the files back-end tests: a fresh database directory per
// test, named to the plug-in through dbroute_cfg.files_dir, and handles that
// close themselves.
#pragma once

#include <sys/stat.h>

#include <cstdio>
#include <cstring>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>

#include <gtest/gtest.h>

#include "contract/backend.h"
#include "contract/dbroute.h"
#include "support/entries.hh"
#include "support/scratch_dir.hh"

extern "C" {
VYR_BACKEND_DECLARE(files)
}

namespace files_test {

using vyr_test::failed_with;
using vyr_test::take;

template <int (*Close)(void*)>
struct HandleClose {
    void operator()(void* h) const {
        if (h != nullptr) Close(h);
    }
};
using MacDb = std::unique_ptr<void, HandleClose<files_closemacdb_r>>;
using LevDb = std::unique_ptr<void, HandleClose<files_closelevdb_r>>;
using CatDb = std::unique_ptr<void, HandleClose<files_closecatdb_r>>;

// Every entry of a walk, one take() per line.
template <class Rec>
std::string walk(void* db, int (*set)(void*), Rec* (*next)(void*)) {
    std::string out = set(db) == 0 ? "" : "set failed\n";
    while (Rec* e = next(db)) out += take(e) + "\n";
    return out;
}

inline std::string read_text(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

// Replaces a file the way an administrator's editor would: new file, rename.
inline void install_text(const std::string& path, const std::string& text) {
    const std::string tmp = path + ".edit";
    std::ofstream(tmp, std::ios::binary | std::ios::trunc) << text;
    ASSERT_EQ(::rename(tmp.c_str(), path.c_str()), 0);
}

class FilesDir : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(dir_.ok());
        set_files_dir(dir_.path());
    }
    void TearDown() override {
        set_files_dir("");
        ::chmod(dir_.path().c_str(), 0755);
    }
    static void set_files_dir(const std::string& dir) {
        std::memset(dbroute_cfg.files_dir, 0, sizeof dbroute_cfg.files_dir);
        dir.copy(dbroute_cfg.files_dir, sizeof dbroute_cfg.files_dir - 1);
    }
    std::string path(const char* file) const { return dir_ / file; }
    // Names in the directory other than the databases and their lock files:
    // leftovers of an unfinished write.
    std::string stray_files() const {
        const std::string cmd =
            "ls -A '" + dir_.path() + "' | grep -v -x -E '(users|levels|categories)(\\.lock)?'";
        std::string out;
        if (FILE* p = ::popen(cmd.c_str(), "r")) {
            char buf[256];
            while (std::fgets(buf, sizeof buf, p) != nullptr) out += buf;
            ::pclose(p);
        }
        return out;
    }

    vyr_test::ScratchDir dir_;
};

}  // namespace files_test
