// The auxiliary platform library: charset conversion, number to text,
// bounded formatting, user records, wide strings, byte order and words.
#include <algorithm>
#include <cerrno>
#include <clocale>
#include <cstdint>
#include <cstring>
#include <cwchar>
#include <string>

#include <gtest/gtest.h>

#include "contract/tavrel_aux.h"
#include "support/failalloc.h"

namespace {

// An iconv descriptor closed at scope exit.
struct Iconv {
	iconv_t cd;
	Iconv(const char *to, const char *from) : cd(iconv_open(to, from)) {}
	~Iconv() { iconv_close(cd); }
};

// A malloc'd result freed at scope exit.
template <class T> struct Owned {
	T *p;
	~Owned() { std::free(p); }
};

// Every result ends in four zero bytes, so that it is terminated in targets
// with wide units too.  The UTF-32 case outgrows the first buffer; a
// stateful target must end back in its initial state.
TEST(Encode, ConvertsAndLeavesNothingOnAllocationFailure)
{
	const struct {
		const char *to, *from;
		std::string in, out;
	} cases[] = {
	    {"ISO-8859-1", "UTF-8", "caf\xc3\xa9", "caf\xe9"},
	    {"UTF-8", "ISO-8859-1", "caf\xe9", "caf\xc3\xa9"},
	    {"UTF-8", "UTF-8", "", ""},
	    {"ISO-2022-JP", "UTF-8", "\xe3\x81\x82", "\x1b$B$\"\x1b(B"}, // ends with the shift back
	};
	for (const auto &c : cases) {
		Iconv cv(c.to, c.from);
		Owned<char> out{zenk_encode(cv.cd, c.in.c_str())};
		ASSERT_NE(out.p, nullptr) << c.from << " -> " << c.to;
		EXPECT_EQ(std::string(out.p, c.out.size() + 4), c.out + std::string(4, '\0')) << c.from << " -> " << c.to;
	}
	Iconv wide("UTF-32LE", "UTF-8");
	const std::string in(100, 'a');
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		Owned<char> out{inj.run([&] { return zenk_encode(wide.cd, in.c_str()); })};
		if (inj.fired()) {
			EXPECT_EQ(out.p, nullptr);
			EXPECT_EQ(errno, ENOMEM);
			return;
		}
		ASSERT_NE(out.p, nullptr);
		std::string want;
		for (int i = 0; i < 101; ++i)
			want += std::string(i < 100 ? "a\0\0\0" : "\0\0\0\0", 4);
		EXPECT_EQ(std::string(out.p, 404), want);
	});
}

// A failed conversion must not spoil the next one on the same descriptor,
// which the caller keeps.  ISO-2022-JP is stateful: a failure after its
// shift into JIS mode leaves the descriptor shifted, and the next result
// must still begin with the shift sequence.
TEST(Encode, FailureGivesNullAndLeavesTheDescriptorUsable)
{
	const struct {
		const char *to, *in, *next;
		int err;
	} cases[] = {
	    {"ISO-8859-1", "\xe2\x82\xac", "ok", EILSEQ}, // not in the target charset
	    {"ISO-8859-1", "a\xff" "b", "ok", EILSEQ},      // invalid input
	    {"ISO-8859-1", "a\xc3", "ok", EINVAL},          // cut sequence
	    {"ISO-2022-JP", "\xe3\x81\x82\xff", "\xe3\x81\x82", EILSEQ},
	};
	for (const auto &c : cases) {
		Iconv used(c.to, "UTF-8"), fresh(c.to, "UTF-8");
		errno = 0;
		EXPECT_EQ(zenk_encode(used.cd, c.in), nullptr) << c.in;
		EXPECT_EQ(errno, c.err) << c.in;
		Owned<char> again{zenk_encode(used.cd, c.next)}, want{zenk_encode(fresh.cd, c.next)};
		ASSERT_TRUE(again.p && want.p) << "after " << c.in;
		EXPECT_STREQ(again.p, want.p) << "after " << c.in;
	}
	errno = 0;
	EXPECT_EQ(zenk_encode(reinterpret_cast<iconv_t>(-1), "x"), nullptr);
	EXPECT_EQ(errno, EBADF);
}

TEST(U64ToStr, DigitsAndRefusals)
{
	const struct {
		uint64_t v;
		unsigned base;
		const char *text; // nullptr: refused with EINVAL, buffer untouched
	} cases[] = {
	    {0, 16, "0"}, {0xdeadbeef, 16, "deadbeef"}, {UINT64_MAX, 16, "ffffffffffffffff"},
	    {UINT64_MAX, 10, "18446744073709551615"}, {5, 2, "101"}, {35, 36, "z"},
	    {1, 0, nullptr}, {1, 1, nullptr}, {1, 37, nullptr},
	    {1ull << 28, 2, "10000000000000000000000000000"}, // 29 digits and the NUL fill the 30 bytes
	    {1ull << 29, 2, nullptr},
	};
	for (const auto &c : cases) {
		char buf[ZENK_U64TOSTR_BUFSIZE];
		std::memset(buf, 'x', sizeof buf);
		errno = 0;
		const char *got = zenk_u64tostr(buf, c.v, c.base);
		EXPECT_EQ(got, c.text ? buf : nullptr) << c.v << " base " << c.base;
		// A refusal sets EINVAL and leaves the buffer alone.
		EXPECT_EQ(c.text ? std::string(buf) : buf[0] + std::to_string(errno), c.text ? c.text : "x" + std::to_string(EINVAL))
		    << c.v << " base " << c.base;
	}
}

// Callers move their cursor by the result: it must count what was stored,
// never what was needed, and nothing may be written past `size`.
TEST(Scnprintf, StoresWhatFitsAndCountsWhatItStored)
{
	const struct {
		size_t size;
		int stored;
		const char *text;
	} cases[] = {{1, 0, ""}, {2, 1, "h"}, {6, 5, "hello"}, {7, 6, "hello4"}, {64, 6, "hello4"}};
	for (const auto &c : cases) {
		char buf[80];
		std::memset(buf, 'x', sizeof buf);
		EXPECT_EQ(zenk_scnprintf(buf, c.size, "%s%d", "hello", 4), c.stored) << "size " << c.size;
		EXPECT_STREQ(buf, c.text) << "size " << c.size;
		EXPECT_EQ(buf[c.size], 'x') << "wrote past size " << c.size;
	}
}

// One free releases the whole record (a leak shows under the sanitizers).
// A full allocation sweep cannot run here: a failure inside the C library's
// lookup leaves caches of its own.  So fail only this library's first one.
TEST(Users, ByNameAndByUidOrEnoent)
{
	Owned<struct passwd> by_name{zenk_getpwnam("root")}, by_uid{zenk_getpwuid(0)};
	ASSERT_TRUE(by_name.p && by_uid.p);
	// libvyr reads only the first word of the record: it must point to the name.
	EXPECT_STREQ(*reinterpret_cast<char **>(by_name.p), "root");
	EXPECT_STREQ(by_uid.p->pw_name, "root");
	EXPECT_STREQ(by_uid.p->pw_dir, by_name.p->pw_dir);
	errno = 0;
	EXPECT_EQ(zenk_getpwnam("no-such-user-tavrel"), nullptr);
	EXPECT_EQ(errno, ENOENT);
	errno = 0;
	EXPECT_EQ(zenk_getpwuid(3999999999u), nullptr);
	EXPECT_EQ(errno, ENOENT);

	vyr_test::FailAlloc::reset();
	vyr_test::Injector first(1);
	errno = 0;
	EXPECT_EQ(first.run([] { return zenk_getpwnam("root"); }), nullptr);
	EXPECT_TRUE(first.fired());
	EXPECT_EQ(errno, ENOMEM);
	EXPECT_EQ(vyr_test::FailAlloc::live(), 0u);
	vyr_test::FailAlloc::reset();
}

TEST(Wide, RoundTripUnconvertibleTextAndAllocationFailure)
{
	const std::string saved = std::setlocale(LC_ALL, nullptr);
	ASSERT_TRUE(std::setlocale(LC_ALL, "C.UTF-8"));
	const char *text = "a\xc3\xa9\xe2\x82\xac"; // a, e acute, euro sign
	// The C library loads its converters on first use: not under the sweep.
	std::free(zenk_string_towc(text));
	// Both calls under one injector: each run() counts afresh.
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		Owned<wchar_t> w{nullptr};
		Owned<char> s{inj.run([&] {
			w.p = zenk_string_towc(text);
			return w.p ? zenk_string_fromwc(w.p) : nullptr;
		})};
		if (inj.fired()) {
			EXPECT_EQ(errno, ENOMEM);
			return;
		}
		ASSERT_TRUE(w.p && s.p);
		EXPECT_EQ(std::wstring(w.p), std::wstring(L"a\u00e9\u20ac"));
		EXPECT_STREQ(s.p, text);
	});
	errno = 0;
	EXPECT_EQ(zenk_string_towc("bad \xff byte"), nullptr);
	EXPECT_EQ(errno, EILSEQ);
	std::setlocale(LC_ALL, "C");
	errno = 0;
	EXPECT_EQ(zenk_string_fromwc(L"\u20ac"), nullptr);
	EXPECT_EQ(errno, EILSEQ);
	std::setlocale(LC_ALL, saved.c_str());
}

// Little-endian conversions by their bytes in memory.  mac_t's external
// form is built with the word setters at odd offsets: each must store
// exactly its own bytes and read back what it stored.
TEST(Words, ByteOrderAndSettersTouchingOnlyTheirBytes)
{
	const uint16_t v16 = zenk_cputole16(0x0102);
	const uint32_t v32 = zenk_cputole32(0x01020304);
	const uint64_t v64 = zenk_cputole64(0x0102030405060708);
	EXPECT_EQ(std::memcmp(&v16, "\x02\x01", 2), 0);
	EXPECT_EQ(std::memcmp(&v32, "\x04\x03\x02\x01", 4), 0);
	EXPECT_EQ(std::memcmp(&v64, "\x08\x07\x06\x05\x04\x03\x02\x01", 8), 0);
	EXPECT_EQ(zenk_le16tocpu(v16), 0x0102u);
	EXPECT_EQ(zenk_le32tocpu(v32), 0x01020304u);
	EXPECT_EQ(zenk_le64tocpu(v64), 0x0102030405060708u);

	const uint64_t value = 0x0102030405060708;
	for (size_t width : {1, 2, 4, 8})
		for (size_t off = 0; off < 8; ++off) {
			uint8_t buf[24];
			std::memset(buf, 0x5a, sizeof buf);
			uint8_t *p = buf + 4 + off;
			uint64_t back = 0;
			switch (width) {
			case 1: zenk_set_w8(p, uint8_t(value)), back = zenk_get_w8(p); break;
			case 2: zenk_set_w16(p, uint16_t(value)), back = zenk_get_w16(p); break;
			case 4: zenk_set_w32(p, uint32_t(value)), back = zenk_get_w32(p); break;
			case 8: zenk_set_w64(p, value), back = zenk_get_w64(p); break;
			}
			EXPECT_EQ(back, value & (~uint64_t{0} >> (64 - 8 * width))) << "width " << width << " offset " << off;
			EXPECT_EQ(std::count(buf, buf + sizeof buf, 0x5a), long(sizeof buf - width)) << "width " << width;
		}
}

} // namespace
