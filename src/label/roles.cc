// Role lists: canonical order, normalisation, constructors from arrays, and
// the operations that copy and grow a caller's array.
//
// Canonical order: strictly descending id, compared as unsigned 64-bit
// numbers; attr and rights take no part in it.  A buffer may be larger than
// its count: entries behind the count have no meaning.
#include "label_internal.hh"

#include <utility>

using namespace vyr::label;

namespace {

// Copies one entry's fields into the slot (padding is left as it lies).
void put_entry(vyr_role_t &slot, const vyr_role_t &from) noexcept
{
	slot.id = from.id;
	slot.attr = from.attr;
	slot.rights = from.rights;
}

// A new array made of head[0, at), then the nins entries of ins, then
// head[at, n).  One routine serves appending (at == n) and inserting into a
// sorted list.  Returns null when the allocation fails; nothing is released
// here, so the caller's arrays are untouched on failure.
vyr_role_t *splice(const vyr_role_t *head, uint32_t n, uint32_t at,
                   const vyr_role_t *ins, uint32_t nins) noexcept
{
	vyr_role_t *out = alloc_roles(uint64_t{n} + nins);
	if (!out)
		return nullptr;
	vyr_role_t *w = out;
	for (uint32_t k = 0; k < at; ++k)
		put_entry(*w++, head[k]);
	for (uint32_t k = 0; k < nins; ++k)
		put_entry(*w++, ins[k]);
	for (uint32_t k = at; k < n; ++k)
		put_entry(*w++, head[k]);
	return out;
}

// Stores a normalised copy of n entries of src into the list slot of a role
// part whose count field is `count`.  A count of 0 leaves the slot NULL and
// does not read src.  The buffer keeps the input's size.
bool fill_list(const vyr_role_t *src, uint32_t n, vyr_role_t *&slot, uint32_t &count) noexcept
{
	if (n == 0)
		return true;
	slot = alloc_roles(n);
	if (!slot)
		return false;
	copy_roles(slot, src, n);
	count = n;
	vyr_roles_normalize(slot, &count);
	return true;
}

} // namespace

extern "C" {

uint64_t vyr_roles_raw_size(uint64_t n) noexcept
{
	return n * 13;
}

vyr_role_t *vyrr_get_new_init(uint64_t id, uint32_t attr, uint8_t rights) noexcept
{
	auto *r = static_cast<vyr_role_t *>(std::malloc(sizeof(vyr_role_t)));
	if (!r)
		return nullptr;
	r->id = id;
	r->attr = attr;
	r->rights = rights;
	return r;
}

int vyrr_cpy(vyr_role_t *dst, const vyr_role_t *src, uint32_t n) noexcept
{
	if (dst == nullptr || src == nullptr)
		return -1;
	copy_roles(dst, src, n);
	return 0;
}

int vyr_role_cmp(const vyr_role_t *a, const vyr_role_t *b) noexcept
{
	if (a == b)
		return 1;
	if (a->id != b->id)
		return 0;
	if (a->attr != b->attr || a->rights != b->rights)
		return 0;
	return 1;
}

// An exchange sort that removes duplicates as it goes.  The exact sequence
// of exchanges is part of the contract: it decides which of several entries
// with one id survives (the one standing at position i when the other is
// reached), and where the removed entries lie behind the new count.
void vyr_roles_normalize(vyr_role_t *roles, uint32_t *count) noexcept
{
	for (uint32_t i = 0; i < *count; ++i) {
		uint32_t j = i + 1;
		while (j < *count) {
			if (roles[i].id == roles[j].id) {
				// Take entry j out: it swaps with the last counted
				// entry, and the same j is looked at again.
				--*count;
				std::swap(roles[j], roles[*count]);
				continue;
			}
			if (roles[i].id < roles[j].id)
				std::swap(roles[i], roles[j]);
			++j;
		}
	}
}

vyrrl_t *vyrrl_get_new_alloc(uint32_t nroles1, uint32_t nroles2) noexcept
{
	ref_ptr<vyrrl_t> r{new_record<vyrrl_t>()};
	if (!r)
		return nullptr;
	if (nroles1 != 0) {
		r->roles1 = alloc_roles(nroles1);
		if (!r->roles1)
			return nullptr;
		r->nroles1 = nroles1;
	}
	if (nroles2 != 0) {
		r->roles2 = alloc_roles(nroles2);
		if (!r->roles2)
			return nullptr;
		r->nroles2 = nroles2;
	}
	return r.release();
}

vyrrl_t *vyrrl_get_new_init_roles(const vyr_role_t *roles1, uint32_t nroles1,
                                  const vyr_role_t *roles2, uint32_t nroles2) noexcept
{
	ref_ptr<vyrrl_t> r{new_record<vyrrl_t>()};
	if (!r)
		return nullptr;
	if (!fill_list(roles1, nroles1, r->roles1, r->nroles1))
		return nullptr;
	if (!fill_list(roles2, nroles2, r->roles2, r->nroles2))
		return nullptr;
	return r.release();
}

vyrl_t *vyrl_get_new_init_mac_roles(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type,
                                    const vyr_role_t *roles1, uint32_t nroles1,
                                    const vyr_role_t *roles2, uint32_t nroles2) noexcept
{
	// Built in this order: the label record, the role part, the
	// mandatory part.
	c_ptr<vyrl_t> shell{new_record<vyrl_t>()};
	if (!shell)
		return nullptr;
	ref_ptr<vyrrl_t> rl{vyrrl_get_new_init_roles(roles1, nroles1, roles2, nroles2)};
	if (!rl)
		return nullptr;
	return assemble(std::move(shell), ref_ptr<vyrml_t>{vyrml_get_new_init(lev, ilev, cat, type)},
	                std::move(rl));
}

vyr_role_t *duplicate_role(const vyr_role_t *r) noexcept
{
	return vyrr_get_new_init(r->id, r->attr, r->rights);
}

// Replaces `old` by a copy of src.  The old array is released whether or not
// the copy can be made (the caller cannot tell the cases apart, so it must
// never use `old` again once *count was non-zero).  The copy is made before
// the release so that src may be old itself.
vyr_role_t *duplicate_mass_all_roles(const vyr_role_t *src, uint32_t n,
                                     vyr_role_t *old, uint32_t *count) noexcept
{
	if (n == 0 || src == nullptr)
		return nullptr;
	vyr_role_t *copy = vyr_role_dup(src, n);
	if (*count != 0)
		std::free(old);
	if (!copy)
		return nullptr;
	*count = n;
	return copy;
}

// A new array of old's entries followed by add's, unsorted.  On success old
// is released; on allocation failure it stays valid and the caller's, and
// *count keeps its value.
vyr_role_t *duplicate_and_add_mass_all_roles(const vyr_role_t *add, uint32_t nadd,
                                             vyr_role_t *old, uint32_t *count) noexcept
{
	if (add == nullptr)
		return nullptr;
	if (*count != 0 && old == nullptr)
		return nullptr;
	const uint32_t n = *count;
	vyr_role_t *out = splice(old, n, n, add, nadd);
	if (!out)
		return nullptr;
	if (n != 0)
		std::free(old);
	*count = n + nadd;
	return out;
}

// Inserts r into a canonical list unless its id is present.  Takes over
// `list`: on success the caller goes on with the result alone.  On
// allocation failure the result is NULL and `list` stays valid and the
// caller's, with *count unchanged.
vyr_role_t *rback_only_new_role_add(const vyr_role_t *r, vyr_role_t *list, uint32_t *count) noexcept
{
	if (*count == 0 || list == nullptr) {
		vyr_role_t *one = splice(nullptr, 0, 0, r, 1);
		if (one)
			*count = 1;
		return one;
	}
	const uint32_t n = *count;
	uint32_t at = 0;
	for (; at < n; ++at) {
		if (list[at].id == r->id)
			return list;
		if (list[at].id < r->id)
			break;
	}
	vyr_role_t *out = splice(list, n, at, r, 1);
	if (!out)
		return nullptr;
	std::free(list);
	*count = n + 1;
	return out;
}

} // extern "C"
