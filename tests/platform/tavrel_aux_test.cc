// The auxiliary platform library: charset conversion, number to text,
// bounded formatting, user records, wide strings, byte order and words.
#include <cerrno>
#include <clocale>
#include <cstdint>
#include <cstring>
#include <cwchar>
#include <string>
#include <vector>

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

// Switches the C locale for one test.
struct LocaleScope {
	std::string saved;
	bool ok;
	explicit LocaleScope(const char *name) : saved(std::setlocale(LC_ALL, nullptr)), ok(std::setlocale(LC_ALL, name)) {}
	~LocaleScope() { std::setlocale(LC_ALL, saved.c_str()); }
};

// ---- zenk_encode ----------------------------------------------------------

TEST(Encode, ConvertsThroughTheDescriptor)
{
	const struct {
		const char *to, *from;
		std::string in, out;
	} cases[] = {
	    {"ISO-8859-1", "UTF-8", "caf\xc3\xa9", "caf\xe9"},
	    {"UTF-8", "ISO-8859-1", "caf\xe9", "caf\xc3\xa9"},
	    {"UTF-8", "UTF-8", "", ""},
	    {"UTF-8", "ISO-8859-1", std::string(3000, '\xe9'), [] {
		 std::string s;
		 for (int i = 0; i < 3000; ++i)
			 s += "\xc3\xa9";
		 return s;
	     }()},  // output twice the input: the buffer must grow
	};
	for (const auto &c : cases) {
		Iconv cv(c.to, c.from);
		ASSERT_TRUE(cv.ok()) << c.from << " -> " << c.to;
		Owned<char> out{zenk_encode(cv.cd, c.in.c_str())};
		ASSERT_NE(out.p, nullptr) << c.from << " -> " << c.to;
		EXPECT_EQ(std::string(out.p), c.out) << c.from << " -> " << c.to;
	}
}

TEST(Encode, WideTargetEndsWithAWideNul)
{
	Iconv cv("UTF-32LE", "UTF-8");
	ASSERT_TRUE(cv.ok());
	Owned<char> out{zenk_encode(cv.cd, "ab")};
	ASSERT_NE(out.p, nullptr);
	const char want[12] = {'a', 0, 0, 0, 'b', 0, 0, 0, 0, 0, 0, 0};
	EXPECT_EQ(std::memcmp(out.p, want, sizeof want), 0);
}

TEST(Encode, FailureGivesNullAndLeavesTheDescriptorUsable)
{
	Iconv cv("ISO-8859-1", "UTF-8");
	ASSERT_TRUE(cv.ok());
	const struct {
		const char *what, *in;
		int err;
	} cases[] = {
	    {"not in the target charset", "\xe2\x82\xac", EILSEQ},
	    {"invalid input", "a\xff" "b", EILSEQ},
	    {"cut multi-byte sequence", "a\xc3", EINVAL},
	};
	for (const auto &c : cases) {
		std::string before(c.in);
		errno = 0;
		EXPECT_EQ(zenk_encode(cv.cd, c.in), nullptr) << c.what;
		EXPECT_EQ(errno, c.err) << c.what;
		EXPECT_EQ(before, c.in) << c.what;
		Owned<char> again{zenk_encode(cv.cd, "ok")};
		ASSERT_NE(again.p, nullptr) << "after " << c.what;
		EXPECT_STREQ(again.p, "ok");
	}
	errno = 0;
	EXPECT_EQ(zenk_encode(reinterpret_cast<iconv_t>(-1), "x"), nullptr);
	EXPECT_EQ(errno, EBADF);
}

TEST(Encode, AllocationFailureLeavesNothing)
{
	Iconv cv("UTF-8", "ISO-8859-1");
	ASSERT_TRUE(cv.ok());
	const std::string in(200, '\xe9');
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		char *out = inj.run([&] { return zenk_encode(cv.cd, in.c_str()); });
		if (inj.fired()) {
			EXPECT_EQ(out, nullptr);
			EXPECT_EQ(errno, ENOMEM);
		} else {
			ASSERT_NE(out, nullptr);
			EXPECT_EQ(std::strlen(out), 400u);
		}
		std::free(out);
	});
}

// ---- zenk_u64tostr --------------------------------------------------------

TEST(U64ToStr, Digits)
{
	const struct {
		uint64_t v;
		unsigned base;
		const char *text;
	} cases[] = {
	    {0, 16, "0"},
	    {0xff, 16, "ff"},
	    {0x10, 16, "10"},
	    {0xdeadbeef, 16, "deadbeef"},
	    {UINT64_MAX, 16, "ffffffffffffffff"},
	    {1234567890, 10, "1234567890"},
	    {UINT64_MAX, 10, "18446744073709551615"},
	    {UINT64_MAX, 8, "1777777777777777777777"},
	    {5, 2, "101"},
	    {35, 36, "z"},
	};
	for (const auto &c : cases) {
		char buf[ZENK_U64TOSTR_BUFSIZE] = {};
		EXPECT_EQ(zenk_u64tostr(buf, c.v, c.base), buf);
		EXPECT_STREQ(buf, c.text) << c.v << " base " << c.base;
	}
}

TEST(U64ToStr, RefusesWhatCannotBeWritten)
{
	const struct {
		uint64_t v;
		unsigned base;
	} cases[] = {{1, 0}, {1, 1}, {1, 37}, {UINT64_MAX, 2}};
	for (const auto &c : cases) {
		char buf[ZENK_U64TOSTR_BUFSIZE];
		std::memset(buf, 'x', sizeof buf);
		errno = 0;
		EXPECT_EQ(zenk_u64tostr(buf, c.v, c.base), nullptr) << "base " << c.base;
		EXPECT_EQ(errno, EINVAL);
		EXPECT_EQ(buf[0], 'x') << "buffer touched";
	}
}

// ---- zenk_scnprintf -------------------------------------------------------

TEST(Scnprintf, StoresWhatFitsAndCountsWhatItStored)
{
	const struct {
		size_t size;
		int stored;
		const char *text;
	} cases[] = {
	    {1, 0, ""}, {2, 1, "h"}, {6, 5, "hello"}, {7, 6, "hello4"}, {8, 6, "hello4"}, {64, 6, "hello4"},
	};
	for (const auto &c : cases) {
		char buf[80];
		std::memset(buf, 'x', sizeof buf);
		EXPECT_EQ(zenk_scnprintf(buf, c.size, "%s%d", "hello", 4), c.stored) << "size " << c.size;
		EXPECT_STREQ(buf, c.text) << "size " << c.size;
		EXPECT_EQ(buf[c.size], 'x') << "wrote past size " << c.size;
	}
}

TEST(Scnprintf, PiecesAppendedAtTheCursorFillTheBufferExactly)
{
	char buf[10];
	char *p = buf;
	size_t left = sizeof buf;
	for (const char *piece : {"abc", "defg", "hijk", "lmn"}) {
		const int n = zenk_scnprintf(p, left, "%s", piece);
		p += n;
		left -= static_cast<size_t>(n);
	}
	EXPECT_STREQ(buf, "abcdefghi");
	EXPECT_EQ(left, 1u);
}

// ---- users ----------------------------------------------------------------

TEST(Users, ByNameAndByUid)
{
	Owned<struct passwd> by_name{zenk_getpwnam("root")};
	ASSERT_NE(by_name.p, nullptr);
	// The first word of the record points to the name.
	EXPECT_STREQ(*reinterpret_cast<char **>(by_name.p), "root");
	EXPECT_EQ(by_name.p->pw_uid, 0u);

	Owned<struct passwd> by_uid{zenk_getpwuid(0)};
	ASSERT_NE(by_uid.p, nullptr);
	EXPECT_STREQ(by_uid.p->pw_name, "root");
	EXPECT_STREQ(by_uid.p->pw_dir, by_name.p->pw_dir);
}

TEST(Users, UnknownUsersGiveEnoent)
{
	errno = 0;
	EXPECT_EQ(zenk_getpwnam("no-such-user-tavrel"), nullptr);
	EXPECT_EQ(errno, ENOENT);
	errno = 0;
	EXPECT_EQ(zenk_getpwuid(3999999999u), nullptr);
	EXPECT_EQ(errno, ENOENT);
}

TEST(Users, OneFreeReleasesTheWholeRecordAndFailureLeavesNothing)
{
	// The C library keeps state of its own from the first lookups, and a
	// failure injected inside its lookup leaves caches behind that are not
	// ours; so warm it up, and inject only into this library's allocation,
	// the first one of the call.
	std::free(zenk_getpwnam("root"));
	using vyr_test::FailAlloc;

	FailAlloc::reset();
	vyr_test::Injector failing(1);
	errno = 0;
	struct passwd *pw = failing.run([] { return zenk_getpwnam("root"); });
	EXPECT_TRUE(failing.fired());
	EXPECT_EQ(pw, nullptr);
	EXPECT_EQ(errno, ENOMEM);
	EXPECT_EQ(FailAlloc::live(), 0u);

	FailAlloc::reset();
	vyr_test::Injector clean(1000000);
	pw = clean.run([] { return zenk_getpwuid(0); });
	ASSERT_NE(pw, nullptr);
	EXPECT_STREQ(pw->pw_name, "root");
	EXPECT_GE(FailAlloc::live(), 1u);
	std::free(pw);
	EXPECT_EQ(FailAlloc::live(), 0u) << "one free left blocks behind";
	FailAlloc::reset();
}

// ---- wide strings ---------------------------------------------------------

TEST(Wide, RoundTripInAUtf8Locale)
{
	LocaleScope loc("C.UTF-8");
	ASSERT_TRUE(loc.ok);
	const char *text = "a\xc3\xa9\xe2\x82\xac";  // a, e acute, euro sign
	Owned<wchar_t> w{zenk_string_towc(text)};
	ASSERT_NE(w.p, nullptr);
	EXPECT_EQ(std::wcslen(w.p), 3u);
	EXPECT_EQ(std::wstring(w.p), std::wstring(L"a\u00e9\u20ac"));
	Owned<char> back{zenk_string_fromwc(w.p)};
	ASSERT_NE(back.p, nullptr);
	EXPECT_STREQ(back.p, text);

	Owned<wchar_t> empty{zenk_string_towc("")};
	ASSERT_NE(empty.p, nullptr);
	EXPECT_EQ(empty.p[0], L'\0');
}

TEST(Wide, UnconvertibleTextGivesNull)
{
	LocaleScope utf8("C.UTF-8");
	ASSERT_TRUE(utf8.ok);
	errno = 0;
	EXPECT_EQ(zenk_string_towc("bad \xff byte"), nullptr);
	EXPECT_EQ(errno, EILSEQ);
	{
		LocaleScope plain("C");
		ASSERT_TRUE(plain.ok);
		errno = 0;
		EXPECT_EQ(zenk_string_fromwc(L"\u20ac"), nullptr);
		EXPECT_EQ(errno, EILSEQ);
	}
}

TEST(Wide, AllocationFailureLeavesNothing)
{
	LocaleScope loc("C.UTF-8");
	ASSERT_TRUE(loc.ok);
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		wchar_t *w = inj.run([] { return zenk_string_towc("abc"); });
		char *s = w ? inj.run([&] { return zenk_string_fromwc(w); }) : nullptr;
		if (!inj.fired()) {
			ASSERT_NE(s, nullptr);
			EXPECT_STREQ(s, "abc");
		} else {
			EXPECT_EQ(errno, ENOMEM);
		}
		std::free(w);
		std::free(s);
	});
}

// ---- byte order and words -------------------------------------------------

template <class T>
std::vector<uint8_t> bytes_of(T v)
{
	std::vector<uint8_t> b(sizeof v);
	std::memcpy(b.data(), &v, sizeof v);
	return b;
}

TEST(ByteOrder, LittleEndianInMemory)
{
	EXPECT_EQ(bytes_of(zenk_cputole16(0x0102)), (std::vector<uint8_t>{0x02, 0x01}));
	EXPECT_EQ(bytes_of(zenk_cputole32(0x01020304)), (std::vector<uint8_t>{0x04, 0x03, 0x02, 0x01}));
	EXPECT_EQ(bytes_of(zenk_cputole64(0x0102030405060708)),
	          (std::vector<uint8_t>{0x08, 0x07, 0x06, 0x05, 0x04, 0x03, 0x02, 0x01}));
	// Loading little-endian bytes from an odd address gives the host value.
	const uint8_t raw[9] = {0xee, 0x08, 0x07, 0x06, 0x05, 0x04, 0x03, 0x02, 0x01};
	uint16_t v16;
	uint32_t v32;
	uint64_t v64;
	std::memcpy(&v16, raw + 1, 2);
	std::memcpy(&v32, raw + 1, 4);
	std::memcpy(&v64, raw + 1, 8);
	EXPECT_EQ(zenk_le16tocpu(v16), 0x0708u);
	EXPECT_EQ(zenk_le32tocpu(v32), 0x05060708u);
	EXPECT_EQ(zenk_le64tocpu(v64), 0x0102030405060708u);
}

TEST(Words, SettersTouchOnlyTheirBytesAtAnyAlignment)
{
	const struct {
		size_t width;
		uint64_t value;
		std::vector<uint8_t> stored;  // big-endian, as documented
	} cases[] = {
	    {1, 0xab, {0xab}},
	    {2, 0xabcd, {0xab, 0xcd}},
	    {4, 0x01020304, {0x01, 0x02, 0x03, 0x04}},
	    {8, 0x0102030405060708, {0x01, 0x02, 0x03, 0x04, 0x05, 0x06, 0x07, 0x08}},
	};
	for (const auto &c : cases) {
		for (size_t off = 0; off < 8; ++off) {
			uint8_t buf[24];
			std::memset(buf, 0x5a, sizeof buf);
			uint8_t *p = buf + 4 + off;
			uint64_t back = 0;
			switch (c.width) {
			case 1: zenk_set_w8(p, static_cast<uint8_t>(c.value)); back = zenk_get_w8(p); break;
			case 2: zenk_set_w16(p, static_cast<uint16_t>(c.value)); back = zenk_get_w16(p); break;
			case 4: zenk_set_w32(p, static_cast<uint32_t>(c.value)); back = zenk_get_w32(p); break;
			case 8: zenk_set_w64(p, c.value); back = zenk_get_w64(p); break;
			}
			EXPECT_EQ(back, c.value) << "width " << c.width << " offset " << off;
			EXPECT_EQ(std::vector<uint8_t>(p, p + c.width), c.stored) << "width " << c.width;
			for (size_t i = 0; i < sizeof buf; ++i) {
				if (buf + i < p || buf + i >= p + c.width) {
					EXPECT_EQ(buf[i], 0x5a) << "width " << c.width << " touched byte " << i;
				}
			}
		}
	}
}

} // namespace
