// Permission decisions: subject first, object second, 0 permitted, -1
// denied.  Decisions are pure functions of their arguments: no allocation,
// no system call, no state, errno untouched.
//
// Layering: one test per field (level, categories, integrity), the
// confidentiality decision over level and categories, the mandatory decision
// over a whole mandatory part, and beside these the role decision.
#include "label_internal.hh"

namespace {

constexpr int permitted = 0;
constexpr int denied = -1;

constexpr bool has(int request, int bit) noexcept
{
	return (request & bit) != 0;
}

// Both reading and executing ask for the object's categories to be held by
// the subject.
constexpr bool cats_within(uint64_t inner, uint64_t outer) noexcept
{
	return (inner & outer) == inner;
}

} // namespace

extern "C" {

int vyr_lev_permission(int subject, int object, int request) noexcept
{
	if (has(request, VYR_REQ_NO_LEV))
		return permitted;
	const auto s = static_cast<uint8_t>(subject);
	const auto o = static_cast<uint8_t>(object);
	if (has(request, VYR_REQ_READ) && s < o)
		return denied;
	// Writing asks for equal levels, which would pass every test below.
	if (has(request, VYR_REQ_WRITE))
		return s == o ? permitted : denied;
	if (has(request, VYR_REQ_EXEC) && s < o)
		return denied;
	if (has(request, VYR_REQ_WRITE_UP) && s > o)
		return denied;
	return permitted;
}

int vyr_cat_permission(uint64_t subject, uint64_t object, int request) noexcept
{
	if (has(request, VYR_REQ_NO_CAT))
		return permitted;
	if (has(request, VYR_REQ_READ) && !cats_within(object, subject))
		return denied;
	if (has(request, VYR_REQ_WRITE) && subject != object)
		return denied;
	if (has(request, VYR_REQ_EXEC) && !cats_within(object, subject))
		return denied;
	if (has(request, VYR_REQ_WRITE_UP) && !cats_within(subject, object))
		return denied;
	return permitted;
}

// Only writing has an integrity test, and both write bits ask for the
// subject at or above the object.
int vyr_ilev_permission(int subject, int object, int request) noexcept
{
	if (has(request, VYR_REQ_NO_ILEV))
		return permitted;
	if (!has(request, VYR_REQ_WRITE | VYR_REQ_WRITE_UP))
		return permitted;
	return static_cast<uint8_t>(subject) < static_cast<uint8_t>(object) ? denied : permitted;
}

int vyrml_conf_permission(const vyrml_t *subject, const vyrml_t *object, int request) noexcept
{
	if (vyr_lev_permission(subject->lev, object->lev, request) != 0)
		return denied;
	if (vyr_cat_permission(subject->cat, object->cat, request) != 0)
		return denied;
	return permitted;
}

int vyrml_permission(const vyrml_t *subject, const vyrml_t *object, int request) noexcept
{
	// The child test comes first: not even ehole escapes it.
	if (has(request, VYR_REQ_CHILD) && has(request, VYR_REQ_OBJ_TYPE) &&
	    vyrml_child_parent(subject, object) != 0)
		return denied;
	if (object->type & VYR_TYPE_EHOLE)
		return permitted;
	// The object's ccnr and ccnri act only when the request asks for it:
	// ccnr lifts the read and execute demands (write demands remain),
	// ccnri lifts the integrity test.
	int effective = request;
	if (has(request, VYR_REQ_OBJ_TYPE)) {
		if (object->type & VYR_TYPE_CCNR)
			effective &= ~(VYR_REQ_READ | VYR_REQ_EXEC);
		if (object->type & VYR_TYPE_CCNRI)
			effective |= VYR_REQ_NO_ILEV;
	}
	if (vyrml_conf_permission(subject, object, effective) != 0)
		return denied;
	if (vyr_ilev_permission(subject->ilev, object->ilev, effective) != 0)
		return denied;
	return permitted;
}

int vyrl_permission(const vyrl_t *subject, const vyrl_t *object, int request) noexcept
{
	return vyrml_permission(subject->ml, object->ml, request);
}

// One merge pass over two lists in strictly descending id order: the object
// index j only moves forward, so the pass takes at most n + m steps.  Grants
// when an id stands in both lists and the object's entry holds every right
// bit of the low four request bits.  The subject's rights are not read.
int vyr_roles_permission(const vyr_role_t *subject, uint32_t n,
                         const vyr_role_t *object, uint32_t m, int request) noexcept
{
	if (m == 0 || n == 0)
		return denied;
	const auto mask = static_cast<uint8_t>(request & 0xf);
	uint32_t j = 0;
	for (uint32_t i = 0; i < n && j < m; ++i) {
		const uint64_t sid = subject[i].id;
		while (j < m) {
			const uint64_t oid = object[j].id;
			if (oid < sid)
				break; // the next subject entry may still meet it
			if (oid == sid && (object[j].rights & mask) == mask)
				return permitted;
			++j;
		}
	}
	return denied;
}

// Either pair of lists may grant; the lists are never crossed.
int vyrrl_permission(const vyrrl_t *subject, const vyrrl_t *object, int request) noexcept
{
	if (vyr_roles_permission(subject->roles1, subject->nroles1, object->roles1, object->nroles1,
	                         request) == 0)
		return permitted;
	return vyr_roles_permission(subject->roles2, subject->nroles2, object->roles2, object->nroles2,
	                            request);
}

} // extern "C"
