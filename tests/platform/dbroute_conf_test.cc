// The configuration reader, driven directly with in-memory text.
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>

#include <gtest/gtest.h>

#include "dbroute_conf.hh"

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

const std::string k63(63, 'n');
const std::string k255 = "/" + std::string(254, 'd');

#define FIELD(name) offsetof(dbroute_cfg_t, name)

// Each key lands in its own field; blanks around keys and values, a final
// CR and comment lines are no part of them.
TEST(DbrouteConf, AcceptedTexts) {
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
    const dbroute_cfg_t zero{};
    for (const auto& c : cases) {
        const Parsed p = parse(c.text);
        ASSERT_TRUE(p.ok) << c.text << ": " << p.error.what;
        EXPECT_EQ(reinterpret_cast<const char*>(&p.cfg) + c.field, c.want) << c.text;
        EXPECT_EQ(std::memcmp(p.cfg.reserved1, zero.reserved1, sizeof zero.reserved1), 0) << c.text;
        EXPECT_EQ(p.cfg.mac_default_entry, 0u) << c.text;
    }
    const struct {
        const char* text;
        uint32_t want;
    } words[] = {{"0", 0}, {"7", 7}, {"0x10", 16}, {"4294967295", UINT32_MAX}, {"0XFFFFFFFF", UINT32_MAX}};
    for (const auto& w : words) {
        const Parsed p = parse(std::string("mac_default_entry = ") + w.text);
        ASSERT_TRUE(p.ok) << w.text;
        EXPECT_EQ(p.cfg.mac_default_entry, w.want) << w.text;
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

} // namespace
