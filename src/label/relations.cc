// Equality, the not-greater order and the child/parent relation.
//
// Equality tests answer 1 (equal) or 0.  The order and the relation answer
// 0 (holds) or -13, the negated EACCES, as a plain value: errno is neither
// set nor read.  Nothing here allocates or changes a record.
#include "label_internal.hh"

namespace {

constexpr int denied = -13;

// One counted role list against another, position by position.  Two NULL
// pointers, or the same pointer, are equal without looking at entries; one
// NULL pointer makes the lists unequal even when the count is 0.
bool lists_equal(uint32_t na, const vyr_role_t *a, uint32_t nb, const vyr_role_t *b) noexcept
{
	if (na != nb)
		return false;
	if (a == b)
		return true;
	if (a == nullptr || b == nullptr)
		return false;
	for (uint32_t k = 0; k < na; ++k)
		if (!vyr_role_cmp(&a[k], &b[k]))
			return false;
	return true;
}

} // namespace

extern "C" {

int vyrml_cmp(const vyrml_t *a, const vyrml_t *b) noexcept
{
	if (a == b)
		return 1;
	if (a->lev != b->lev || a->ilev != b->ilev)
		return 0;
	if (a->cat != b->cat)
		return 0;
	if (a->type != b->type || a->blob_size != b->blob_size)
		return 0;
	if (a->blob_size == 0)
		return 1;
	return std::memcmp(a->blob, b->blob, a->blob_size) == 0 ? 1 : 0;
}

// The third argument is accepted for the interface's sake and never read.
int vyrrl_cmp(const vyrrl_t *a, const vyrrl_t *b, uint32_t) noexcept
{
	if (a == b)
		return 1;
	if (!lists_equal(a->nroles1, a->roles1, b->nroles1, b->roles1))
		return 0;
	return lists_equal(a->nroles2, a->roles2, b->nroles2, b->roles2) ? 1 : 0;
}

int vyrl_cmp(const vyrl_t *a, const vyrl_t *b, uint32_t unused) noexcept
{
	if (a == b)
		return 1;
	if (a->ml != b->ml && !vyrml_cmp(a->ml, b->ml))
		return 0;
	if (a->rl == b->rl)
		return 1;
	return vyrrl_cmp(a->rl, b->rl, unused);
}

// a is not greater than b: lev and ilev at most b's (unsigned), and every
// category of a also in b.  type, blob and roles play no part.
int vyrml_notg(const vyrml_t *a, const vyrml_t *b) noexcept
{
	if (a->lev > b->lev)
		return denied;
	if (a->ilev > b->ilev)
		return denied;
	if ((a->cat & b->cat) != a->cat)
		return denied;
	return 0;
}

int vyrl_notg(const vyrl_t *a, const vyrl_t *b) noexcept
{
	return vyrml_notg(a->ml, b->ml);
}

// A child never lies above its parent.  Lying lower in lev, or holding
// fewer categories, needs the parent's ccnr; lying lower in ilev needs its
// ccnri.  The child's own type is not read.
int vyrml_child_parent(const vyrml_t *child, const vyrml_t *parent) noexcept
{
	if (vyrml_notg(child, parent) != 0)
		return denied;
	const bool ccnr = (parent->type & VYR_TYPE_CCNR) != 0;
	const bool ccnri = (parent->type & VYR_TYPE_CCNRI) != 0;
	if (child->lev < parent->lev && !ccnr)
		return denied;
	if (child->ilev < parent->ilev && !ccnri)
		return denied;
	if (child->cat != parent->cat && !ccnr)
		return denied;
	return 0;
}

int vyr_child_parent(const vyrl_t *child, const vyrl_t *parent) noexcept
{
	return vyrml_child_parent(child->ml, parent->ml);
}

} // extern "C"
