// The configuration reader, driven directly with in-memory text.
#include <cerrno>
#include <cstring>
#include <ostream>
#include <string>

#include <gtest/gtest.h>

#include "dbroute_conf.hh"

namespace {

using vyr::dbroute::ConfError;
using vyr::dbroute::parse_config;

struct Parsed {
    bool ok;
    dbroute_cfg_t cfg;
    ConfError error;
};

Parsed parse(const std::string& text) {
    Parsed p{};
    std::memset(&p.cfg, 0x5a, sizeof p.cfg);  // the reader must clear it
    p.ok = parse_config(text, p.cfg, p.error);
    return p;
}

TEST(DbrouteConf, FullConfigurationFillsEveryField) {
    const Parsed p = parse(
        "# name databases\n"
        "mac_backend = files\n"
        "mac_charset = UTF-8\n"
        "\n"
        "lev_backend=files\n"
        "lev_charset\t=\tKOI8-R\r\n"
        "   cat_backend = other   \n"
        "cat_charset = ISO-8859-1//TRANSLIT\n"
        "files_dir = /var/lib/vyr db\n"
        "mac_default_entry = 1\n");
    ASSERT_TRUE(p.ok) << p.error.what;
    EXPECT_STREQ(p.cfg.mac_backend, "files");
    EXPECT_STREQ(p.cfg.mac_charset, "UTF-8");
    EXPECT_STREQ(p.cfg.lev_backend, "files");
    EXPECT_STREQ(p.cfg.lev_charset, "KOI8-R");
    EXPECT_STREQ(p.cfg.cat_backend, "other");
    EXPECT_STREQ(p.cfg.cat_charset, "ISO-8859-1//TRANSLIT");
    EXPECT_STREQ(p.cfg.files_dir, "/var/lib/vyr db");
    EXPECT_EQ(p.cfg.mac_default_entry, 1u);
    // Bytes outside the fields are cleared as well.
    for (unsigned char c : p.cfg.reserved1) ASSERT_EQ(c, 0);
}

TEST(DbrouteConf, EmptyTextGivesZeroBlock) {
    const Parsed p = parse("");
    ASSERT_TRUE(p.ok);
    const dbroute_cfg_t zero{};
    EXPECT_EQ(std::memcmp(&p.cfg, &zero, sizeof zero), 0);
}

TEST(DbrouteConf, LastOfRepeatedKeysWinsAndEmptyValueClears) {
    const Parsed p = parse("lev_backend = first\nlev_backend = second\nmac_backend = x\nmac_backend =\n");
    ASSERT_TRUE(p.ok);
    EXPECT_STREQ(p.cfg.lev_backend, "second");
    EXPECT_STREQ(p.cfg.mac_backend, "");
}

TEST(DbrouteConf, OnlyTheFirstEqualsSplits) {
    const Parsed p = parse("files_dir = /a=b\n");
    ASSERT_TRUE(p.ok);
    EXPECT_STREQ(p.cfg.files_dir, "/a=b");
}

struct Refusal {
    const char* label;
    std::string text;
    int err;
    unsigned line;
};

void PrintTo(const Refusal& r, std::ostream* os) { *os << r.label; }

class DbrouteConfRefusal : public ::testing::TestWithParam<Refusal> {};

TEST_P(DbrouteConfRefusal, ReportsErrnoAndLine) {
    const Refusal& r = GetParam();
    const Parsed p = parse(r.text);
    EXPECT_FALSE(p.ok);
    EXPECT_EQ(p.error.err, r.err) << std::strerror(p.error.err);
    EXPECT_EQ(p.error.line, r.line);
    EXPECT_NE(std::strlen(p.error.what), 0u);
}

const std::string k63(63, 'n');
const std::string k255 = "/" + std::string(254, 'd');

INSTANTIATE_TEST_SUITE_P(
    Table, DbrouteConfRefusal,
    ::testing::Values(
        Refusal{"unknown_key", "mac_backend = files\nlevel_backend = files\n", EINVAL, 2},
        Refusal{"reserved_is_no_key", "reserved1 = x\n", EINVAL, 1},
        Refusal{"no_equals", "# c\nmac_backend files\n", EINVAL, 2},
        Refusal{"empty_key", "= files\n", EINVAL, 1},
        Refusal{"backend_64", "cat_backend = " + k63 + "n\n", ENAMETOOLONG, 1},
        Refusal{"charset_64", "\n\nlev_charset = " + k63 + "x\n", ENAMETOOLONG, 3},
        Refusal{"dir_256", "files_dir = " + k255 + "d\n", ENAMETOOLONG, 1},
        Refusal{"slash_in_backend", "mac_backend = ../evil\n", EINVAL, 1},
        Refusal{"absolute_backend", "lev_backend = /tmp/x\n", EINVAL, 1},
        Refusal{"blank_in_backend", "cat_backend = files # default\n", EINVAL, 1},
        Refusal{"blank_in_charset", "cat_charset = UTF 8\n", EINVAL, 1},
        Refusal{"relative_dir", "files_dir = var/lib/vyr\n", EINVAL, 1},
        Refusal{"empty_dir", "files_dir =\n", EINVAL, 1},
        Refusal{"word_not_number", "mac_default_entry = yes\n", EINVAL, 1},
        Refusal{"word_negative", "mac_default_entry = -1\n", EINVAL, 1},
        Refusal{"word_trailing", "mac_default_entry = 1x\n", EINVAL, 1},
        Refusal{"word_empty", "mac_default_entry =\n", EINVAL, 1},
        Refusal{"word_bare_hex_prefix", "mac_default_entry = 0x\n", EINVAL, 1},
        Refusal{"word_overflow", "mac_default_entry = 4294967296\n", ERANGE, 1},
        Refusal{"nul_byte", std::string("mac_backend = fi\0les\n", 21), EINVAL, 1}),
    [](const auto& info) { return std::string(info.param.label); });

struct Accepted {
    const char* label;
    std::string text;
};

void PrintTo(const Accepted& a, std::ostream* os) { *os << a.label; }

class DbrouteConfLimit : public ::testing::TestWithParam<Accepted> {};

TEST_P(DbrouteConfLimit, IsAccepted) {
    const Parsed p = parse(GetParam().text);
    EXPECT_TRUE(p.ok) << p.error.what << " at line " << p.error.line;
}

INSTANTIATE_TEST_SUITE_P(
    Table, DbrouteConfLimit,
    ::testing::Values(Accepted{"backend_63", "mac_backend = " + k63 + "\n"},
                      Accepted{"dir_255", "files_dir = " + k255 + "\n"},
                      Accepted{"word_max", "mac_default_entry = 4294967295\n"},
                      Accepted{"word_hex", "mac_default_entry = 0xFFFFFFFF\n"},
                      Accepted{"no_final_newline", "mac_backend = files"},
                      Accepted{"comment_after_blanks", "   # mac_backend = a/b\n"}),
    [](const auto& info) { return std::string(info.param.label); });

TEST(DbrouteConf, WordValues) {
    const struct {
        const char* text;
        std::uint32_t want;
    } cases[] = {{"mac_default_entry = 0", 0}, {"mac_default_entry = 7", 7}, {"mac_default_entry = 0x10", 16}};
    for (const auto& c : cases) {
        const Parsed p = parse(c.text);
        ASSERT_TRUE(p.ok) << c.text;
        EXPECT_EQ(p.cfg.mac_default_entry, c.want) << c.text;
    }
}

}  // namespace
