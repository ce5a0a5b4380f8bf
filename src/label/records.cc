// Label records: constructors, use counts, deep copies and the two static
// labels.
//
// Every constructor builds into owning pointers (ref_ptr / c_ptr) and hands
// the result out only once it is complete, so a failed allocation at any
// step unwinds whatever was built so far and no half-built label escapes.
// A vyrl_t therefore never leaves this file with a NULL ml or rl.
#include "label_internal.hh"

#include <utility>

using namespace vyr::label;

namespace {

// The static labels.  constinit: they are plain data, so nothing runs at
// load time.  They are writable because vyrl_get/vyrl_put on them change
// their use counts; their first reference is never dropped.
constinit vyrml_t zero_ml{0, 0, 0, 0, 0, nullptr, 1};
constinit vyrrl_t zero_rl{0, 0, nullptr, nullptr, 1};
constinit vyrl_t zero_label{&zero_ml, &zero_rl, 1};

constinit vyrml_t equ_ml{0, 0, 0, VYR_TYPE_EHOLE, 0, nullptr, 1};
constinit vyrrl_t equ_rl{0, 0, nullptr, nullptr, 1};
constinit vyrl_t equ_label{&equ_ml, &equ_rl, 1};

// Copies one counted role list.  A list is copied only when it has both
// entries and a buffer; otherwise the copy's pointer is NULL while its count
// (set by the caller) stays as the source had it.  Returns false when the
// allocation fails.
bool copy_list(const vyr_role_t *src, uint32_t n, vyr_role_t *&dst) noexcept
{
	dst = nullptr;
	if (src == nullptr || n == 0)
		return true;
	dst = vyr_role_dup(src, n);
	return dst != nullptr;
}

template <class Rec>
int64_t read_count(const Rec *rec) noexcept
{
	// A momentary value: relaxed, i.e. a plain load that is still well
	// defined while other threads change the count.
	return std::atomic_ref<int32_t>(const_cast<int32_t &>(rec->ucnt)).load(std::memory_order_relaxed);
}

} // namespace

extern "C" {

vyrl_t *const VYRL_ZERO = &zero_label;
vyrl_t *const VYRL_EQU = &equ_label;

// ---- Constructors ---------------------------------------------------------

vyrml_t *vyrml_get_new(void) noexcept
{
	return new_record<vyrml_t>();
}

vyrrl_t *vyrrl_get_new(void) noexcept
{
	return new_record<vyrrl_t>();
}

vyrl_t *vyrl_get_new(void) noexcept
{
	return vyrl_get_new_init_mr(nullptr, nullptr);
}

vyrml_t *vyrml_get_new_init(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type) noexcept
{
	vyrml_t *m = new_record<vyrml_t>();
	if (!m)
		return nullptr;
	m->lev = lev;
	m->ilev = ilev;
	m->cat = cat;
	m->type = type;
	return m;
}

vyrl_t *vyrl_get_new_init_mr(vyrml_t *ml, vyrrl_t *rl) noexcept
{
	c_ptr<vyrl_t> shell{new_record<vyrl_t>()};
	if (!shell)
		return nullptr;
	// Only parts made here for a NULL argument are ours to release on
	// failure; the caller's parts stay the caller's until we succeed.
	ref_ptr<vyrml_t> own_ml{ml ? nullptr : vyrml_get_new()};
	if (!ml && !own_ml)
		return nullptr;
	ref_ptr<vyrrl_t> own_rl{rl ? nullptr : vyrrl_get_new()};
	if (!rl && !own_rl)
		return nullptr;
	shell->ml = ml ? ml : own_ml.release();
	shell->rl = rl ? rl : own_rl.release();
	return shell.release();
}

vyrl_t *vyrl_get_new_init_mac(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type) noexcept
{
	c_ptr<vyrl_t> shell{new_record<vyrl_t>()};
	if (!shell)
		return nullptr;
	ref_ptr<vyrml_t> ml{vyrml_get_new_init(lev, ilev, cat, type)};
	if (!ml)
		return nullptr;
	return assemble(std::move(shell), std::move(ml), ref_ptr<vyrrl_t>{vyrrl_get_new()});
}

// ---- Role array helpers -----------------------------------------------------

uint64_t vyr_roles_size(uint64_t n) noexcept
{
	return roles_bytes(n);
}

vyr_role_t *vyr_role_dup(const vyr_role_t *roles, uint32_t n) noexcept
{
	vyr_role_t *copy = alloc_roles(n);
	if (copy)
		copy_roles(copy, roles, n);
	return copy;
}

// ---- Use counts -------------------------------------------------------------

vyrl_t *vyrl_get(vyrl_t *l) noexcept
{
	take_ref(l);
	return l;
}

vyrl_t *vyrlnc_get(vyrl_t *l) noexcept
{
	return vyrl_get(l);
}

vyrml_t *vyrml_get(vyrml_t *m) noexcept
{
	take_ref(m);
	return m;
}

vyrrl_t *vyrrl_get(vyrrl_t *r) noexcept
{
	take_ref(r);
	return r;
}

void vyrml_put(vyrml_t *m) noexcept
{
	if (!drop_ref(m))
		return;
	std::free(m->blob);
	std::free(m);
}

void vyrrl_put(vyrrl_t *r) noexcept
{
	if (!drop_ref(r))
		return;
	std::free(r->roles1);
	std::free(r->roles2);
	std::free(r);
}

void vyrl_put(vyrl_t *l) noexcept
{
	if (!drop_ref(l))
		return;
	if (l->ml)
		vyrml_put(l->ml);
	if (l->rl)
		vyrrl_put(l->rl);
	std::free(l);
}

int64_t vyrl_ucnt(const vyrl_t *l) noexcept
{
	return read_count(l);
}

int64_t vyrml_ucnt(const vyrml_t *m) noexcept
{
	return read_count(m);
}

int64_t vyrrl_ucnt(const vyrrl_t *r) noexcept
{
	return read_count(r);
}

// ---- Deep copies ----------------------------------------------------------------

vyrml_t *vyrml_dup(const vyrml_t *src) noexcept
{
	ref_ptr<vyrml_t> m{new_record<vyrml_t>()};
	if (!m)
		return nullptr;
	m->lev = src->lev;
	m->ilev = src->ilev;
	m->cat = src->cat;
	m->type = src->type;
	m->blob_size = src->blob_size;
	if (src->blob != nullptr && src->blob_size != 0) {
		m->blob = static_cast<unsigned char *>(std::malloc(src->blob_size));
		if (!m->blob)
			return nullptr;
		std::memcpy(m->blob, src->blob, src->blob_size);
	}
	return m.release();
}

vyrrl_t *vyrrl_dup(const vyrrl_t *src) noexcept
{
	// Counts are copied as they stand, also where the list pointer stays
	// NULL; a partly filled copy is released by vyrrl_put, which frees
	// whichever arrays were made.
	ref_ptr<vyrrl_t> r{new_record<vyrrl_t>()};
	if (!r)
		return nullptr;
	r->nroles2 = src->nroles2;
	if (!copy_list(src->roles2, src->nroles2, r->roles2))
		return nullptr;
	r->nroles1 = src->nroles1;
	if (!copy_list(src->roles1, src->nroles1, r->roles1))
		return nullptr;
	return r.release();
}

vyrl_t *vyrl_dup(const vyrl_t *src) noexcept
{
	c_ptr<vyrl_t> shell{new_record<vyrl_t>()};
	if (!shell)
		return nullptr;
	ref_ptr<vyrml_t> ml{vyrml_dup(src->ml)};
	if (!ml)
		return nullptr;
	return assemble(std::move(shell), std::move(ml), ref_ptr<vyrrl_t>{vyrrl_dup(src->rl)});
}

vyrml_t *vyrl_ml(const vyrl_t *l) noexcept
{
	return l->ml;
}

vyrrl_t *vyrl_rl(const vyrl_t *l) noexcept
{
	return l->rl;
}

} // extern "C"
