// Fuzz target for the label format engine.
//
// The input is a label (first bytes) and a format (the rest).  The engine
// must never read past the format, must take an int argument only for F, and
// its count must be exactly the bytes it appended.  The obstack form and the
// string form must agree.
#include <vyr/text.h>

#include "checks.hh"
#include "scratch_db.hh"

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <obstack.h>
#include <string>

namespace {

using vyr_fuzz::require;

void *chunk_malloc(long n)
{
	return std::malloc(static_cast<size_t>(n));
}

constexpr size_t kHeader = 14;
// Every directive may be an F; the engine gets this many ints and a format
// with more '%' than that is not tried.
constexpr int kMaxArgs = 24;

// Flag words handed to F: numeric, named, named-only and omit-zero mixes.
constexpr int kFlagWords[] = {1, 65, 0, 33, 97, 64, 32, 1};

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***)
{
	// Level and category names from a scratch files database, so that the
	// writers' name lookups (and NAMED_ONLY refusals) take part.
	vyr_fuzz::install_scratch_db();
	return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
	if (size < kHeader)
		return 0;
	vyr_role_t roles[6];
	for (int i = 0; i < 6; ++i)
		roles[i] = vyr_role_t{static_cast<uint64_t>(data[12]) << (i * 8) | uint64_t(i), 0, 0};
	vyrml_t ml{};
	ml.lev = data[0];
	ml.ilev = data[1];
	ml.type = static_cast<uint16_t>(data[2] | data[3] << 8);
	std::memcpy(&ml.cat, data + 4, sizeof ml.cat);
	ml.ucnt = 1;
	vyrrl_t rl{};
	rl.nroles1 = data[13] & 3;
	rl.nroles2 = (data[13] >> 2) & 3;
	rl.roles1 = rl.nroles1 ? roles : nullptr;
	rl.roles2 = rl.nroles2 ? roles + 3 : nullptr;
	rl.ucnt = 1;
	vyrl_t l{&ml, &rl, 1};

	const std::string fmt(reinterpret_cast<const char *>(data + kHeader), size - kHeader);
	const char *f = fmt.c_str(); // ends at the first NUL of the input
	int percents = 0;
	for (const char *p = f; *p != '\0'; ++p)
		percents += *p == '%';
	if (percents > kMaxArgs)
		return 0;

	int a[kMaxArgs];
	for (int i = 0; i < kMaxArgs; ++i)
		a[i] = kFlagWords[(i + data[13]) % 8];
#define VYR_FUZZ_ARGS                                                                  \
	a[0], a[1], a[2], a[3], a[4], a[5], a[6], a[7], a[8], a[9], a[10], a[11], a[12],  \
	    a[13], a[14], a[15], a[16], a[17], a[18], a[19], a[20], a[21], a[22], a[23]

	struct obstack o;
	_obstack_begin(&o, 0, 0, chunk_malloc, std::free);
	const int n = vyrl_obstack_printf(&l, &o, f, VYR_FUZZ_ARGS);
	const size_t written = obstack_object_size(&o);
	require(n == -1 || static_cast<size_t>(n) == written);
	std::string via_obstack(static_cast<const char *>(obstack_base(&o)), written);
	obstack_free(&o, nullptr);

	char *s = vyrl_asprintf(&l, f, VYR_FUZZ_ARGS);
#undef VYR_FUZZ_ARGS
	require((s == nullptr) == (n == -1));
	if (s != nullptr) {
		require(via_obstack == s);
		std::free(s);
	}
	return 0;
}
