// Shared set-up of the files back-end tests: a fresh database directory per
// test, named to the plug-in through dbroute_cfg.files_dir.
#pragma once

#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>
#include <memory>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "contract/backend.h"
#include "contract/dbroute.h"

extern "C" {
VYR_BACKEND_DECLARE_MAC(files)
VYR_BACKEND_DECLARE_LEV(files)
VYR_BACKEND_DECLARE_CAT(files)
}

namespace files_test {

struct RecordFree {
    template <class Rec>
    void operator()(Rec* r) const {
        if (r != nullptr) std::free(r->name);
        std::free(r);
    }
};
using MacPtr = std::unique_ptr<macent_t, RecordFree>;
using LevPtr = std::unique_ptr<levent_t, RecordFree>;
using CatPtr = std::unique_ptr<catent_t, RecordFree>;

// Closes a database handle with the matching close entry.
template <int (*Close)(void*)>
struct HandleClose {
    void operator()(void* h) const {
        if (h != nullptr) Close(h);
    }
};
using MacDb = std::unique_ptr<void, HandleClose<files_closemacdb_r>>;
using LevDb = std::unique_ptr<void, HandleClose<files_closelevdb_r>>;
using CatDb = std::unique_ptr<void, HandleClose<files_closecatdb_r>>;

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
        char tmpl[] = "/tmp/files-backend-XXXXXX";
        ASSERT_NE(::mkdtemp(tmpl), nullptr);
        dir_ = tmpl;
        std::memset(dbroute_cfg.files_dir, 0, sizeof dbroute_cfg.files_dir);
        std::strncpy(dbroute_cfg.files_dir, dir_.c_str(), sizeof dbroute_cfg.files_dir - 1);
    }
    void TearDown() override {
        std::memset(dbroute_cfg.files_dir, 0, sizeof dbroute_cfg.files_dir);
        ::chmod(dir_.c_str(), 0755);
        const std::string cmd = "rm -rf '" + dir_ + "'";
        ASSERT_EQ(std::system(cmd.c_str()), 0);
    }
    std::string path(const char* file) const { return dir_ + "/" + file; }
    // Names in the directory other than the databases and their lock files:
    // leftovers of an unfinished write.
    std::string stray_files() const {
        std::string cmd = "ls -A '" + dir_ + "' | grep -v -x -E '(users|levels|categories)(\\.lock)?'";
        std::string out;
        if (FILE* p = ::popen(cmd.c_str(), "r")) {
            char buf[256];
            while (std::fgets(buf, sizeof buf, p) != nullptr) out += buf;
            ::pclose(p);
        }
        return out;
    }

    std::string dir_;
};

}  // namespace files_test
