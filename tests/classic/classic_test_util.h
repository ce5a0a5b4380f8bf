// Owners and a maker shared by the classic interface tests.
#pragma once

#include <vyr/classic.h>

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>

namespace classic_test {

struct Free {
    void operator()(mac_t *m) const { mac_free(m); }
    void operator()(void *p) const { std::free(p); }
};
using Mac = std::unique_ptr<mac_t, Free>;
using Text = std::unique_ptr<char, Free>;

// A value made by mac_init (so type_low follows the type) with these fields.
inline Mac make(unsigned lev, uint64_t cat, uint32_t type) {
    Mac m{mac_init(type)};
    EXPECT_NE(m, nullptr);
    if (m) m->lev = static_cast<uint8_t>(lev), m->cat = cat;
    return m;
}

// A value as "lev cat type" (the last two in hex); a type_low out of step shows as "low <x>".
inline std::string str(const mac_t *m) {
    if (!m) return "null";
    char b[64];
    const int n = std::snprintf(b, sizeof b, "%u %llx %x", unsigned{m->lev}, (unsigned long long)m->cat, m->type);
    if (m->type_low != (m->type & 0xffu)) std::snprintf(b + n, sizeof b - n, " low %x", m->type_low);
    return b;
}

// Expects call() to give -1 with errno e.
template <class F> void expect_fail(F call, int e, const char *what = "") {
    errno = 0;
    EXPECT_EQ(call(), -1) << what;
    EXPECT_EQ(errno, e) << what;
}

}  // namespace classic_test
