// Fuzz target for the whole-label text readers.
//
// Each input is read twice, by the copying reader and by the in-place reader
// on a writable copy. Both must agree, a label that comes back must be well
// formed (fresh records, normalised role lists, no blob), and the in-place
// reader may only have turned separators into NUL bytes.
#include <vyr/label.h>
#include <vyr/text.h>

#include "checks.hh"
#include "scratch_db.hh"

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace {

using vyr_fuzz::require;

void check_label(const vyrl_t *l)
{
	require(l != VYRL_ZERO && l->ml != nullptr && l->rl != nullptr);
	require(vyrl_ucnt(l) == 1 && vyrml_ucnt(l->ml) == 1 && vyrrl_ucnt(l->rl) == 1);
	require(l->ml->blob == nullptr && l->ml->blob_size == 0);
	vyr_fuzz::require_normalised(l->rl->roles1, l->rl->nroles1);
	vyr_fuzz::require_normalised(l->rl->roles2, l->rl->nroles2);
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
	const std::string_view input(reinterpret_cast<const char *>(data), size);
	vyr_fuzz::Text original(input), work(input);
	vyrl_t *copied = vyrl_get_from_text(original.data());
	vyrl_t *in_place = vyrl_get_from_text_nc(work.data());

	require((copied == nullptr) == (in_place == nullptr));
	vyr_fuzz::require_cut_only(original, work, "!:,");
	if (copied != nullptr) {
		check_label(copied);
		check_label(in_place);
		require(vyrl_cmp(copied, in_place, 0) == 1);
		vyrl_put(copied);
		vyrl_put(in_place);
	}
	return 0;
}
