// Field access and label algebra on the mandatory part.
//
// Every change is made in place on the vyrml_t, so it shows in every label
// that shares the part.  Values are stored at the field's width (the
// parameter types do the narrowing), levels compare as unsigned bytes.  The
// vyrl_* forms are the vyrml_* forms applied to the label's ml.
#include "label_internal.hh"

#include <algorithm>
#include <cerrno>

using namespace vyr::label;

namespace {

// Outcome of replacing a held reference by a private copy; each exported
// form maps it to its own result convention.
enum class Replace { same, no_memory, done };

template <class Rec, class Dup, class Put>
Replace replace_held(Rec **dst, const Rec *src, Dup dup, Put put) noexcept
{
	if (*dst == src)
		return Replace::same;
	Rec *copy = dup(src);
	if (!copy)
		return Replace::no_memory; // *dst keeps its record and reference
	put(*dst);
	*dst = copy;
	return Replace::done;
}

} // namespace

extern "C" {

// ---- Accessors ---------------------------------------------------------------

uint8_t vyrml_lev(const vyrml_t *m) noexcept { return m->lev; }
uint8_t vyrml_ilev(const vyrml_t *m) noexcept { return m->ilev; }
uint64_t vyrml_cat(const vyrml_t *m) noexcept { return m->cat; }
uint16_t vyrml_type(const vyrml_t *m) noexcept { return m->type; }
uint8_t vyrl_lev(const vyrl_t *l) noexcept { return vyrml_lev(l->ml); }
uint8_t vyrl_ilev(const vyrl_t *l) noexcept { return vyrml_ilev(l->ml); }
uint64_t vyrl_cat(const vyrl_t *l) noexcept { return vyrml_cat(l->ml); }
uint16_t vyrl_type(const vyrl_t *l) noexcept { return vyrml_type(l->ml); }

// ---- Setters and bit operations ----------------------------------------------

void vyrml_set_lev(vyrml_t *m, uint8_t v) noexcept { m->lev = v; }
void vyrml_set_ilev(vyrml_t *m, uint8_t v) noexcept { m->ilev = v; }
void vyrml_set_cat(vyrml_t *m, uint64_t v) noexcept { m->cat = v; }
void vyrml_set_type(vyrml_t *m, uint16_t v) noexcept { m->type = v; }
void vyrml_and_cat(vyrml_t *m, uint64_t v) noexcept { m->cat &= v; }
void vyrml_or_cat(vyrml_t *m, uint64_t v) noexcept { m->cat |= v; }
void vyrml_and_type(vyrml_t *m, uint16_t v) noexcept { m->type &= v; }
void vyrml_or_type(vyrml_t *m, uint16_t v) noexcept { m->type |= v; }

void vyrl_set_lev(vyrl_t *l, uint8_t v) noexcept { vyrml_set_lev(l->ml, v); }
void vyrl_set_ilev(vyrl_t *l, uint8_t v) noexcept { vyrml_set_ilev(l->ml, v); }
void vyrl_set_cat(vyrl_t *l, uint64_t v) noexcept { vyrml_set_cat(l->ml, v); }
void vyrl_set_type(vyrl_t *l, uint16_t v) noexcept { vyrml_set_type(l->ml, v); }
void vyrl_and_cat(vyrl_t *l, uint64_t v) noexcept { vyrml_and_cat(l->ml, v); }
void vyrl_or_cat(vyrl_t *l, uint64_t v) noexcept { vyrml_or_cat(l->ml, v); }
void vyrl_subtract_cat(vyrl_t *l, uint64_t v) noexcept { vyrml_and_cat(l->ml, ~v); }
void vyrl_and_type(vyrl_t *l, uint16_t v) noexcept { vyrml_and_type(l->ml, v); }
void vyrl_or_type(vyrl_t *l, uint16_t v) noexcept { vyrml_or_type(l->ml, v); }
void vyrl_subtract_type(vyrl_t *l, uint16_t v) noexcept
{
	vyrml_and_type(l->ml, static_cast<uint16_t>(~v));
}

// ---- Level arithmetic ----------------------------------------------------------

uint8_t vyr_lev_max(uint8_t a, uint8_t b) noexcept { return std::max(a, b); }
uint8_t vyr_lev_min(uint8_t a, uint8_t b) noexcept { return std::min(a, b); }
// Integrity levels are plain numbers in the same sense as levels.
uint8_t vyr_ilev_max(uint8_t a, uint8_t b) noexcept { return vyr_lev_max(a, b); }
uint8_t vyr_ilev_min(uint8_t a, uint8_t b) noexcept { return vyr_lev_min(a, b); }

void vyrl_maximize_lev(vyrl_t *l, uint8_t v) noexcept { l->ml->lev = vyr_lev_max(l->ml->lev, v); }
void vyrl_minimize_lev(vyrl_t *l, uint8_t v) noexcept { l->ml->lev = vyr_lev_min(l->ml->lev, v); }
void vyrl_maximize_ilev(vyrl_t *l, uint8_t v) noexcept { l->ml->ilev = vyr_ilev_max(l->ml->ilev, v); }
void vyrl_minimize_ilev(vyrl_t *l, uint8_t v) noexcept { l->ml->ilev = vyr_ilev_min(l->ml->ilev, v); }

// ---- Combining two labels ----------------------------------------------------------
//
// b may be a itself: each field of b is read before the same field of a is
// written, so vyrl_subtract(a, a) keeps the levels and clears cat and type.

vyrl_t *vyrl_unite(vyrl_t *a, const vyrl_t *b) noexcept
{
	vyrml_t *x = a->ml;
	const vyrml_t *y = b->ml;
	x->lev = vyr_lev_max(x->lev, y->lev);
	x->ilev = vyr_ilev_max(x->ilev, y->ilev);
	x->cat |= y->cat;
	x->type |= y->type;
	return a;
}

vyrl_t *vyrl_subtract(vyrl_t *a, const vyrl_t *b) noexcept
{
	vyrml_t *x = a->ml;
	const vyrml_t *y = b->ml;
	x->lev = vyr_lev_min(x->lev, y->lev);
	x->ilev = vyr_ilev_min(x->ilev, y->ilev);
	x->cat &= ~y->cat;
	x->type &= static_cast<uint16_t>(~y->type);
	return a;
}

// ---- Replacing a held reference by a private copy ------------------------------------

vyrl_t *vyrl_upd(vyrl_t **dst, const vyrl_t *src) noexcept
{
	switch (replace_held(dst, src, vyrl_dup, vyrl_put)) {
	case Replace::same:
		errno = EINVAL;
		return nullptr;
	case Replace::no_memory:
		return nullptr;
	case Replace::done:
		break;
	}
	return *dst;
}

// Reports its failures as positive numbers and leaves errno alone.
int vyrml_own_cpy(vyrml_t **dst, const vyrml_t *src) noexcept
{
	switch (replace_held(dst, src, vyrml_dup, vyrml_put)) {
	case Replace::same:
		return EINVAL;
	case Replace::no_memory:
		return ENOMEM;
	case Replace::done:
		break;
	}
	return 0;
}

// A copy onto itself counts as success here.
int vyrrl_own_cpy(vyrrl_t **dst, const vyrrl_t *src) noexcept
{
	switch (replace_held(dst, src, vyrrl_dup, vyrrl_put)) {
	case Replace::same:
		return 0;
	case Replace::no_memory:
		return -1;
	case Replace::done:
		break;
	}
	return 0;
}

} // extern "C"
