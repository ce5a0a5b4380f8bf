// Fuzz target for the single-field and half-label text readers, with level
// and category names served by the files back-end from a scratch database.
//
// Each input is read by every reader. Properties checked:
// - the copying and the in-place form of a reader agree, and the in-place
//   form only turns separators into NUL bytes;
// - what a reader accepts, written back in numbers (and, for levels and
//   categories, with names), reads back as the same value;
// - the role readers hand out normalised lists (descending ids, no
//   duplicates, attr and rights cleared);
// - a refused role, classic value or kernel record is left as it was.
#include <vyr/classic.h>
#include <vyr/label.h>
#include <vyr/text.h>

#include "checks.hh"
#include "scratch_db.hh"

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

namespace {

using vyr_fuzz::require;
using vyr_fuzz::require_cut_only;
using vyr_fuzz::require_normalised;
using vyr_fuzz::Text;

// Writes a field as text (NULL on out-of-memory or, with names, on no name).
template <class Write>
void round_trip_field(Write write, int flags, auto read, auto expected)
{
	char *text = write(flags);
	if (text == nullptr)
		return;
	decltype(expected) back{};
	require(read(text, &back) == 0);
	require(back == expected);
	std::free(text);
}

void check_lev(const std::string &s)
{
	uint8_t lev = 0;
	if (vyr_lev_from_text(s.c_str(), &lev) != 0)
		return;
	for (int flags : {VYR_TEXT_NUMERIC, 0})
		round_trip_field([lev](int f) { return vyr_lev_get_text(lev, f); }, flags, vyr_lev_from_text, lev);
}

void check_ilev(const std::string &s)
{
	uint8_t ilev = 0;
	if (vyr_ilev_from_text(s.c_str(), &ilev) != 0)
		return;
	round_trip_field([ilev](int f) { return vyr_ilev_get_text(ilev, f); }, VYR_TEXT_NUMERIC, vyr_ilev_from_text,
	                 ilev);
}

void check_cat(const std::string &s)
{
	Text original(s), worked(s);
	uint64_t copied = 0, in_place = 0;
	const int rc = vyr_cat_from_text(original.data(), &copied);
	require(vyr_cat_from_text_nc(worked.data(), &in_place) == rc);
	require(copied == in_place); // also the partial result of a failure
	require_cut_only(original, worked, ",");
	if (rc != 0)
		return;
	for (int flags : {VYR_TEXT_NUMERIC, 0})
		round_trip_field([copied](int f) { return vyr_cat_get_text(copied, f); }, flags, vyr_cat_from_text,
		                 copied);
}

void check_type(const std::string &s)
{
	uint16_t type = 0;
	if (vyr_type_from_text(s.c_str(), &type) != 0)
		return;
	// Only the numeric form comes back whole: in "ccnr,0x8" the number
	// replaces the names before it.
	round_trip_field([type](int f) { return vyr_type_get_text(type, f); }, VYR_TEXT_NUMERIC, vyr_type_from_text,
	                 type);
}

void check_roles(const std::string &s)
{
	const vyr_role_t before{0x1122334455667788ull, 7, 3};
	vyr_role_t role = before;
	if (vyr_role_from_text(&role, s.c_str()) == 0)
		require(role.attr == 0 && role.rights == 0);
	else
		require(std::memcmp(&role, &before, sizeof role) == 0);

	Text original(s), worked(s);
	vyr_role_t *list = reinterpret_cast<vyr_role_t *>(&worked); // never a real list: proves "not written"
	uint32_t count = 0xdeadbeef;
	if (vyr_roles_from_text(worked.data(), &list, &count) != 0) {
		require(list == reinterpret_cast<vyr_role_t *>(&worked) && count == 0xdeadbeef);
	} else {
		require_normalised(list, count);
		std::free(list);
	}
	require_cut_only(original, worked, ",");
}

void check_ml(const std::string &s)
{
	Text original(s), worked(s);
	vyrml_t *copied = vyrml_get_from_text(original.data());
	vyrml_t *in_place = vyrml_get_from_text_nc(worked.data());
	require((copied == nullptr) == (in_place == nullptr));
	require_cut_only(original, worked, ":,");
	if (copied != nullptr) {
		require(vyrml_ucnt(copied) == 1 && copied->blob == nullptr && copied->blob_size == 0);
		require(vyrml_cmp(copied, in_place) == 1);
		if (char *text = vyrml_get_text(copied, VYR_TEXT_NUMERIC)) {
			vyrml_t *back = vyrml_get_from_text(text);
			require(back != nullptr && vyrml_cmp(copied, back) == 1);
			vyrml_put(back);
			std::free(text);
		}
		vyrml_put(copied);
		vyrml_put(in_place);
	}
}

void check_rl(const std::string &s)
{
	Text original(s), worked(s);
	vyrrl_t *copied = vyrrl_get_from_text(original.data());
	vyrrl_t *in_place = vyrrl_get_from_text_nc(worked.data());
	require((copied == nullptr) == (in_place == nullptr));
	require_cut_only(original, worked, ":,");
	if (copied != nullptr) {
		require(vyrrl_ucnt(copied) == 1);
		require_normalised(copied->roles1, copied->nroles1);
		require_normalised(copied->roles2, copied->nroles2);
		require(vyrrl_cmp(copied, in_place, 0) == 1);
		if (char *text = vyrrl_get_text(copied, VYR_TEXT_NUMERIC)) {
			vyrrl_t *back = vyrrl_get_from_text(text);
			require(back != nullptr && vyrrl_cmp(copied, back, 0) == 1);
			vyrrl_put(back);
			std::free(text);
		}
		vyrrl_put(copied);
		vyrrl_put(in_place);
	}
}

void check_classic_records(const std::string &s)
{
	const tavrel_mac_t mac_before{0x5a, 0x1234};
	tavrel_mac_t mac = mac_before;
	if (tavrel_mac_t_from_text(&mac, s.c_str()) != 0)
		require(mac.lev == mac_before.lev && mac.cat == mac_before.cat);

	const tavrel_mac_label_t label_before{9, {0x33, 0x40}};
	tavrel_mac_label_t label = label_before;
	if (tavrel_mac_label_t_from_text(&label, s.c_str()) != 0)
		require(label.type_low == label_before.type_low && label.mac.lev == label_before.mac.lev &&
		        label.mac.cat == label_before.mac.cat);
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***)
{
	vyr_fuzz::install_scratch_db();
	return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
	const std::string s(reinterpret_cast<const char *>(data), size);
	const std::string text = s.c_str(); // the readers see the text up to the first NUL
	check_lev(text);
	check_ilev(text);
	check_cat(text);
	check_type(text);
	check_roles(text);
	check_ml(text);
	check_rl(text);
	check_classic_records(text);
	return 0;
}
