// Owners and a maker shared by the classic interface tests.
#pragma once

#include <vyr/classic.h>

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>

namespace classic_test {

struct MacDeleter {
    void operator()(mac_t *m) const { mac_free(m); }
};
using Mac = std::unique_ptr<mac_t, MacDeleter>;

struct FreeDeleter {
    void operator()(void *p) const { std::free(p); }
};
using Text = std::unique_ptr<char, FreeDeleter>;

// A value made by mac_init (so type_low follows the type) with these fields.
inline Mac make(unsigned lev, uint64_t cat, uint32_t type) {
    Mac m{mac_init(type)};
    EXPECT_NE(m, nullptr);
    if (m) {
        m->lev = static_cast<uint8_t>(lev);
        m->cat = cat;
    }
    return m;
}

// A whole value as "lev cat type", the last two in hexadecimal, so that one
// check states it; a type_low out of step with the type shows as "low <x>".
inline std::string str(const mac_t *m) {
    if (!m) return "null";
    char b[64];
    const auto cat = static_cast<unsigned long long>(m->cat);
    const int n = std::snprintf(b, sizeof b, "%u %llx %x", unsigned{m->lev}, cat, m->type);
    if (m->type_low != (m->type & 0xffu)) std::snprintf(b + n, sizeof b - n, " low %x", m->type_low);
    return b;
}

}  // namespace classic_test
