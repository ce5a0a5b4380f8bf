// Fuzz target for the whole-label text readers.
//
// Each input is read twice, by the copying reader and by the in-place reader
// on a writable copy. Both must agree, a label that comes back must be well
// formed (fresh records, normalised role lists, no blob), and the in-place
// reader may only have turned separators into NUL bytes.
#include <vyr/label.h>
#include <vyr/text.h>

#include "scratch_db.hh"

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <vector>

namespace {

void require(bool ok)
{
	if (!ok)
		__builtin_trap();
}

bool is_separator(char c)
{
	return c == '!' || c == ':' || c == ',';
}

void check_list(const vyr_role_t *roles, uint32_t n)
{
	require((roles == nullptr) == (n == 0));
	for (uint32_t i = 0; i < n; ++i) {
		require(roles[i].attr == 0 && roles[i].rights == 0);
		if (i > 0)
			require(roles[i - 1].id > roles[i].id);
	}
}

void check_label(const vyrl_t *l)
{
	require(l != VYRL_ZERO && l->ml != nullptr && l->rl != nullptr);
	require(vyrl_ucnt(l) == 1 && vyrml_ucnt(l->ml) == 1 && vyrrl_ucnt(l->rl) == 1);
	require(l->ml->blob == nullptr && l->ml->blob_size == 0);
	check_list(l->rl->roles1, l->rl->nroles1);
	check_list(l->rl->roles2, l->rl->nroles2);
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***)
{
	// Level and category names from a scratch files database, so that the
	// name lookups of the readers take part.
	vyr_fuzz::install_scratch_db();
	return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
	// The readers take C strings: the text ends at the first NUL.
	std::vector<char> original(data, data + size);
	original.push_back('\0');
	const size_t len = std::strlen(original.data());

	vyrl_t *copied = vyrl_get_from_text(original.data());
	std::vector<char> work = original;
	vyrl_t *in_place = vyrl_get_from_text_nc(work.data());

	require((copied == nullptr) == (in_place == nullptr));
	for (size_t i = 0; i < len; ++i) {
		if (work[i] != original[i])
			require(work[i] == '\0' && is_separator(original[i]));
	}
	if (copied != nullptr) {
		check_label(copied);
		check_label(in_place);
		require(vyrl_cmp(copied, in_place, 0) == 1);
		vyrl_put(copied);
		vyrl_put(in_place);
	}
	return 0;
}
