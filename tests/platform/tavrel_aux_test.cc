// The auxiliary platform library: charset conversion, number to text,
// bounded formatting, user records, wide strings, byte order and words.
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
	~Iconv()
	{
		if (cd != reinterpret_cast<iconv_t>(-1))
			iconv_close(cd);
	}
	bool ok() const { return cd != reinterpret_cast<iconv_t>(-1); }
};

// Frees a malloc'd result at scope exit.
template <class T>
struct Owned {
	T *p;
	~Owned() { std::free(p); }
};

// Switches the C locale for one scope.
struct LocaleScope {
	std::string saved;
	bool ok;
	explicit LocaleScope(const char *name) : saved(std::setlocale(LC_ALL, nullptr)), ok(std::setlocale(LC_ALL, name)) {}
	~LocaleScope() { std::setlocale(LC_ALL, saved.c_str()); }
};

std::string repeat(const std::string &s, int n)
{
	std::string out;
	while (n-- > 0)
		out += s;
	return out;
}

// Every result ends in four zero bytes, so that it is terminated in targets
// with wide units too (the UTF-32 row, whose output also outgrows the first
// buffer, twice the input).
TEST(Encode, ConvertsThroughTheDescriptor)
{
	const struct {
		const char *to, *from;
		std::string in, out;
	} cases[] = {
	    {"ISO-8859-1", "UTF-8", "caf\xc3\xa9", "caf\xe9"},
	    {"UTF-8", "ISO-8859-1", "caf\xe9", "caf\xc3\xa9"},
	    {"UTF-8", "UTF-8", "", ""},
	    {"UTF-32LE", "UTF-8", repeat("ab", 50), repeat(std::string("a\0\0\0b\0\0\0", 8), 50)},
	};
	for (const auto &c : cases) {
		Iconv cv(c.to, c.from);
		ASSERT_TRUE(cv.ok()) << c.from << " -> " << c.to;
		Owned<char> out{zenk_encode(cv.cd, c.in.c_str())};
		ASSERT_NE(out.p, nullptr) << c.from << " -> " << c.to;
		EXPECT_EQ(std::string(out.p, c.out.size() + 4), c.out + std::string(4, '\0')) << c.from << " -> " << c.to;
	}
}

// A failed conversion must not spoil the next one on the same descriptor:
// the caller keeps it open.  ISO-2022-JP is stateful: a failure after its
// shift into JIS mode leaves the descriptor shifted, and the next result
// must still begin with the shift sequence.
TEST(Encode, FailureGivesNullAndLeavesTheDescriptorUsable)
{
	const char *const hiragana_a = "\xe3\x81\x82";
	const struct {
		const char *to, *in, *next;
		int err;
	} cases[] = {
	    {"ISO-8859-1", "\xe2\x82\xac", "ok", EILSEQ},  // not in the target charset
	    {"ISO-8859-1", "a\xff" "b", "ok", EILSEQ},       // invalid input
	    {"ISO-8859-1", "a\xc3", "ok", EINVAL},           // cut sequence
	    {"ISO-2022-JP", "\xe3\x81\x82\xff", hiragana_a, EILSEQ},
	};
	for (const auto &c : cases) {
		Iconv used(c.to, "UTF-8"), fresh(c.to, "UTF-8");
		ASSERT_TRUE(used.ok() && fresh.ok()) << c.to;
		errno = 0;
		EXPECT_EQ(zenk_encode(used.cd, c.in), nullptr) << c.in;
		EXPECT_EQ(errno, c.err) << c.in;
		Owned<char> again{zenk_encode(used.cd, c.next)}, want{zenk_encode(fresh.cd, c.next)};
		ASSERT_NE(again.p, nullptr) << "after " << c.in;
		ASSERT_NE(want.p, nullptr);
		EXPECT_STREQ(again.p, want.p) << "after " << c.in;
	}
	errno = 0;
	EXPECT_EQ(zenk_encode(reinterpret_cast<iconv_t>(-1), "x"), nullptr);
	EXPECT_EQ(errno, EBADF);
}

TEST(Encode, AllocationFailureLeavesNothing)
{
	Iconv cv("UTF-32LE", "UTF-8");
	ASSERT_TRUE(cv.ok());
	const std::string in(100, 'a');  // grows the output buffer once
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		Owned<char> out{inj.run([&] { return zenk_encode(cv.cd, in.c_str()); })};
		if (inj.fired()) {
			EXPECT_EQ(out.p, nullptr);
			EXPECT_EQ(errno, ENOMEM);
		} else {
			ASSERT_NE(out.p, nullptr);
			EXPECT_EQ(std::string(out.p, 400), repeat(std::string("a\0\0\0", 4), 100));
		}
	});
}

TEST(U64ToStr, DigitsAndRefusals)
{
	const struct {
		uint64_t v;
		unsigned base;
		const char *text;  // nullptr: refused with EINVAL, buffer untouched
	} cases[] = {
	    {0, 16, "0"}, {0xdeadbeef, 16, "deadbeef"}, {UINT64_MAX, 16, "ffffffffffffffff"},
	    {UINT64_MAX, 10, "18446744073709551615"}, {5, 2, "101"}, {35, 36, "z"},
	    {1, 0, nullptr}, {1, 1, nullptr}, {1, 37, nullptr},
	    {UINT64_MAX, 2, nullptr},  // 64 digits do not fit the 30-byte buffer
	};
	for (const auto &c : cases) {
		char buf[ZENK_U64TOSTR_BUFSIZE];
		std::memset(buf, 'x', sizeof buf);
		errno = 0;
		const char *got = zenk_u64tostr(buf, c.v, c.base);
		if (c.text) {
			EXPECT_EQ(got, buf);
			EXPECT_STREQ(buf, c.text) << c.v << " base " << c.base;
		} else {
			EXPECT_EQ(got, nullptr) << c.v << " base " << c.base;
			EXPECT_EQ(errno, EINVAL);
			EXPECT_EQ(buf[0], 'x') << "buffer touched, base " << c.base;
		}
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

TEST(Users, ByNameAndByUidOrEnoent)
{
	Owned<struct passwd> by_name{zenk_getpwnam("root")};
	ASSERT_NE(by_name.p, nullptr);
	// libvyr reads only the first word of the record: it must point to the name.
	EXPECT_STREQ(*reinterpret_cast<char **>(by_name.p), "root");
	Owned<struct passwd> by_uid{zenk_getpwuid(0)};
	ASSERT_NE(by_uid.p, nullptr);
	EXPECT_STREQ(by_uid.p->pw_name, "root");
	EXPECT_STREQ(by_uid.p->pw_dir, by_name.p->pw_dir);

	errno = 0;
	EXPECT_EQ(zenk_getpwnam("no-such-user-tavrel"), nullptr);
	EXPECT_EQ(errno, ENOENT);
	errno = 0;
	EXPECT_EQ(zenk_getpwuid(3999999999u), nullptr);
	EXPECT_EQ(errno, ENOENT);
}

// That one free releases the whole record shows as a leak under the
// sanitizers in the test above.  A full sweep cannot be run here: a failure
// injected inside the C library's lookup leaves caches of its own behind.
// So warm those up, and fail only this library's allocation, the first one.
TEST(Users, AllocationFailureLeavesNothing)
{
	std::free(zenk_getpwnam("root"));
	vyr_test::FailAlloc::reset();
	vyr_test::Injector first(1);
	errno = 0;
	EXPECT_EQ(first.run([] { return zenk_getpwnam("root"); }), nullptr);
	EXPECT_TRUE(first.fired());
	EXPECT_EQ(errno, ENOMEM);
	EXPECT_EQ(vyr_test::FailAlloc::live(), 0u);
	vyr_test::FailAlloc::reset();
}

TEST(Wide, RoundTripAndUnconvertibleText)
{
	LocaleScope utf8("C.UTF-8");
	ASSERT_TRUE(utf8.ok);
	const char *text = "a\xc3\xa9\xe2\x82\xac";  // a, e acute, euro sign
	Owned<wchar_t> w{zenk_string_towc(text)};
	ASSERT_NE(w.p, nullptr);
	EXPECT_EQ(std::wstring(w.p), std::wstring(L"a\u00e9\u20ac"));
	Owned<char> back{zenk_string_fromwc(w.p)};
	ASSERT_NE(back.p, nullptr);
	EXPECT_STREQ(back.p, text);

	errno = 0;
	EXPECT_EQ(zenk_string_towc("bad \xff byte"), nullptr);
	EXPECT_EQ(errno, EILSEQ);
	LocaleScope plain("C");
	ASSERT_TRUE(plain.ok);
	errno = 0;
	EXPECT_EQ(zenk_string_fromwc(L"\u20ac"), nullptr);
	EXPECT_EQ(errno, EILSEQ);
}

TEST(Wide, AllocationFailureLeavesNothing)
{
	LocaleScope loc("C.UTF-8");
	ASSERT_TRUE(loc.ok);
	// Both calls under one injector: each run() counts afresh, so two runs
	// would never reach the second call's allocation.
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		Owned<wchar_t> w{nullptr};
		Owned<char> s{inj.run([&] {
			w.p = zenk_string_towc("abc");
			return w.p ? zenk_string_fromwc(w.p) : nullptr;
		})};
		if (inj.fired()) {
			EXPECT_EQ(errno, ENOMEM);
			return;
		}
		ASSERT_NE(s.p, nullptr);
		EXPECT_STREQ(s.p, "abc");
	});
}

TEST(ByteOrder, LittleEndianInMemoryAndBack)
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
}

// mac_t's external form is built with these at odd offsets: each must store
// exactly its own bytes and read back what it stored.  (Which byte order
// they store in is the library's own choice.)
TEST(Words, SettersTouchOnlyTheirBytesAtAnyAlignment)
{
	const uint64_t value = 0x0102030405060708;
	for (size_t width : {1, 2, 4, 8}) {
		for (size_t off = 0; off < 8; ++off) {
			uint8_t buf[24];
			std::memset(buf, 0x5a, sizeof buf);
			uint8_t *p = buf + 4 + off;
			uint64_t back = 0;
			switch (width) {
			case 1: zenk_set_w8(p, static_cast<uint8_t>(value)); back = zenk_get_w8(p); break;
			case 2: zenk_set_w16(p, static_cast<uint16_t>(value)); back = zenk_get_w16(p); break;
			case 4: zenk_set_w32(p, static_cast<uint32_t>(value)); back = zenk_get_w32(p); break;
			case 8: zenk_set_w64(p, value); back = zenk_get_w64(p); break;
			}
			EXPECT_EQ(back, value & (~uint64_t{0} >> (64 - 8 * width))) << "width " << width << " offset " << off;
			for (size_t i = 0; i < sizeof buf; ++i) {
				if (buf + i < p || buf + i >= p + width) {
					EXPECT_EQ(buf[i], 0x5a) << "width " << width << " touched byte " << i;
				}
			}
		}
	}
}

} // namespace
