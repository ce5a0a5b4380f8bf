// Fuzz target: the decoder of the label service's stored form (the bytes of
// a file's label attribute or of a process record).  Any input must either
// be refused or decode to a label that fills records and encodes back to
// exactly the same bytes; a short offer must answer E2BIG with the sizes.
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "label_codec.hh"

namespace {

void check(bool ok)
{
	if (!ok)
		__builtin_trap();
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
	tavrel::StoredLabel s;
	const int err = tavrel::decode_label(data, size, &s);
	if (err) {
		check(err == EIO || err == EINVAL);
		return 0;
	}
	// A form that decodes is no larger than its input, so these are bounded.
	std::vector<uint8_t> blob(s.blob_size);
	std::vector<vyr_role_t> r1(s.nroles1), r2(s.nroles2);
	vyrml_t ml{};
	vyrrl_t rl{};
	vyrl_t l{&ml, &rl, 1};

	// Nothing offered: E2BIG exactly when something variable is stored.
	const bool variable = s.blob_size || s.nroles1 || s.nroles2;
	check(tavrel::fill_label(s, &l) == (variable ? E2BIG : 0));
	check(ml.blob_size == s.blob_size && rl.nroles1 == s.nroles1 && rl.nroles2 == s.nroles2);

	ml.blob = s.blob_size ? blob.data() : nullptr;
	rl.roles1 = s.nroles1 ? r1.data() : nullptr;
	rl.roles2 = s.nroles2 ? r2.data() : nullptr;
	check(tavrel::fill_label(s, &l) == 0);
	check(tavrel::check_label(&l) == 0);

	std::vector<uint8_t> again(tavrel::encoded_size(&l));
	check(again.size() == size);
	tavrel::encode_label(&l, again.data());
	check(std::memcmp(again.data(), data, size) == 0);
	return 0;
}
