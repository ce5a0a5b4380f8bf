// libdbroute: the configuration reader on in-memory text, then dbroute_init
// on the file named by VYR_DBROUTE_CONF.
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>

#include <gtest/gtest.h>

#include "contract/dbroute.h"
#include "dbroute_conf.hh"
#include "support/failalloc.h"
#include "support/scratch_dir.hh"

namespace {

struct Parsed {
    bool ok;
    dbroute_cfg_t cfg;
    vyr::dbroute::ConfError error;
};

Parsed parse(const std::string& text) {
    Parsed p{};
    std::memset(&p.cfg, 0x5a, sizeof p.cfg);  // the reader must clear what it is not told
    p.ok = vyr::dbroute::parse_config(text, p.cfg, p.error);
    return p;
}

const std::string k63(63, 'n'), k255 = "/" + std::string(254, 'd');

// Each key lands in its own field; blanks around keys and values, a final
// CR and comment lines are no part of them.
TEST(DbrouteConf, AcceptedTexts) {
#define FIELD(name) offsetof(dbroute_cfg_t, name)
    const struct {
        std::string text;
        size_t field;  // offset of the text field to look at
        std::string want;
    } cases[] = {
        {"# name databases\n\nmac_backend = files\n", FIELD(mac_backend), "files"},
        {"mac_charset = UTF-8", FIELD(mac_charset), "UTF-8"},
        {"lev_backend=files\n", FIELD(lev_backend), "files"},
        {"lev_charset\t=\tKOI8-R\r\n", FIELD(lev_charset), "KOI8-R"},
        {"   cat_backend = other   \n", FIELD(cat_backend), "other"},
        {"cat_charset = ISO-8859-1//TRANSLIT\n", FIELD(cat_charset), "ISO-8859-1//TRANSLIT"},
        {"files_dir = /var/lib/vyr db\n", FIELD(files_dir), "/var/lib/vyr db"},  // inner blanks stay
        {"files_dir = /a=b\n", FIELD(files_dir), "/a=b"},                        // only the first '=' splits
        {"lev_backend = first\nlev_backend = second\n", FIELD(lev_backend), "second"},
        {"mac_backend = x\nmac_backend =\n", FIELD(mac_backend), ""},
        {"mac_backend = " + k63 + "\n", FIELD(mac_backend), k63},
        {"files_dir = " + k255, FIELD(files_dir), k255},
        {"   # mac_backend = a/b\n", FIELD(mac_backend), ""},
    };
#undef FIELD
    const dbroute_cfg_t zero{};
    for (const auto& c : cases) {
        const Parsed p = parse(c.text);
        ASSERT_TRUE(p.ok) << c.text << ": " << p.error.what;
        EXPECT_EQ(reinterpret_cast<const char*>(&p.cfg) + c.field, c.want) << c.text;
        EXPECT_EQ(std::memcmp(p.cfg.reserved1, zero.reserved1, sizeof zero.reserved1), 0) << c.text;
        EXPECT_EQ(p.cfg.mac_default_entry, 0u) << c.text;
    }
    const std::pair<const char*, uint32_t> words[] = {
        {"0", 0}, {"7", 7}, {"0x10", 16}, {"4294967295", UINT32_MAX}, {"0XFFFFFFFF", UINT32_MAX}};
    for (const auto& [text, want] : words) {
        const Parsed p = parse(std::string("mac_default_entry = ") + text);
        ASSERT_TRUE(p.ok) << text;
        EXPECT_EQ(p.cfg.mac_default_entry, want) << text;
    }
}

// Every refusal names the errno and the line, so that a person can fix the file.
TEST(DbrouteConf, RefusedTexts) {
    const struct {
        std::string text;
        int err;
        unsigned line;
    } cases[] = {
        {"mac_backend = files\nlevel_backend = files\n", EINVAL, 2},
        {"reserved1 = x\n", EINVAL, 1},  // reserved bytes are no key
        {"# c\n\nmac_backend files\n", EINVAL, 3},
        {"cat_backend = " + k63 + "n\n", ENAMETOOLONG, 1},
        {"files_dir = " + k255 + "d\n", ENAMETOOLONG, 1},
        {"mac_backend = ../evil\n", EINVAL, 1},  // becomes part of a file name
        {"cat_backend = files # default\n", EINVAL, 1},
        {"cat_charset = UTF 8\n", EINVAL, 1},
        {"files_dir = var/lib/vyr\n", EINVAL, 1},
        {"files_dir =\n", EINVAL, 1},
        {"mac_default_entry = yes\n", EINVAL, 1},
        {"mac_default_entry = -1\n", EINVAL, 1},
        {"mac_default_entry = 1x\n", EINVAL, 1},
        {"mac_default_entry =\n", EINVAL, 1},
        {"mac_default_entry = 4294967296\n", ERANGE, 1},
        {std::string("mac_backend = fi\0les\n", 21), EINVAL, 1},
    };
    for (const auto& c : cases) {
        const Parsed p = parse(c.text);
        EXPECT_FALSE(p.ok) << c.text;
        EXPECT_EQ(p.error.err, c.err) << c.text;
        EXPECT_EQ(p.error.line, c.line) << c.text;
        EXPECT_NE(std::strlen(p.error.what), 0u) << c.text;
    }
}

class DbrouteInit : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(dir_.ok());
        std::memset(&dbroute_cfg, 0, sizeof dbroute_cfg);
    }
    void TearDown() override { ::unsetenv("VYR_DBROUTE_CONF"); }
    // Names `path` in VYR_DBROUTE_CONF after writing `text` to our file.
    void use(const std::string& path, const std::string& text) {
        std::ofstream(conf_, std::ios::trunc) << text;
        ::setenv("VYR_DBROUTE_CONF", path.c_str(), 1);
    }
    vyr_test::ScratchDir dir_;
    const std::string conf_ = dir_ / "dbroute.conf";
};

// A load replaces the whole block: keys missing from the new file are
// cleared.  A refused file, or no memory, leaves the block exactly as it was
// loaded before and sets errno; a refused file is named on stderr.
TEST_F(DbrouteInit, LoadReplacesTheBlockAndFailureLeavesIt) {
    const struct {
        std::string text, path;  // written to our file, then named
        int err;
    } cases[] = {
        {"lev_backend = x\nbogus = 1\n", conf_, EINVAL},
        {std::string(2u << 20, '\n'), conf_, EFBIG},
        {"", dir_ / "missing", ENOENT},
        {"", dir_.path(), EISDIR},
    };
    const auto failed_init = [](vyr_test::Injector* inj) {
        ::testing::internal::CaptureStderr();
        errno = 0;
        const int rc = inj ? inj->run([] { return dbroute_init(); }) : dbroute_init();
        const int err = errno;
        return std::make_tuple(rc, err, ::testing::internal::GetCapturedStderr());
    };
    use(conf_, "mac_backend = files\nmac_default_entry = 1\n");
    ASSERT_EQ(dbroute_init(), 0);
    use(conf_, "lev_backend = files\nfiles_dir = /srv/db\n");
    ASSERT_EQ(dbroute_init(), 0);
    EXPECT_STREQ(dbroute_cfg.mac_backend, "");
    EXPECT_EQ(dbroute_cfg.mac_default_entry, 0u);
    EXPECT_STREQ(dbroute_cfg.files_dir, "/srv/db");
    dbroute_cfg_t before;
    std::memcpy(&before, &dbroute_cfg, sizeof before);
    for (const auto& c : cases) {
        use(c.path, c.text);
        const auto [rc, err, diag] = failed_init(nullptr);
        EXPECT_LT(rc, 0) << c.path;
        EXPECT_EQ(err, c.err) << c.path;
        EXPECT_EQ(std::memcmp(&before, &dbroute_cfg, sizeof before), 0) << c.path;
        EXPECT_NE(diag.find(c.path), std::string::npos) << diag;
    }
    use(conf_, "lev_backend = other\n");
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector& inj) {
        const auto [rc, err, diag] = failed_init(&inj);
        EXPECT_EQ(rc, inj.fired() ? -1 : 0);
        EXPECT_EQ(inj.fired() ? err : ENOMEM, ENOMEM);
        EXPECT_STREQ(dbroute_cfg.lev_backend, inj.fired() ? "files" : "other");
    });
}

}  // namespace
