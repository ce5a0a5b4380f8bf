// The scripted label service; see kdouble.h.
#include "kdouble.h"

#include <malloc.h>

#include <algorithm>
#include <bit>
#include <cerrno>

namespace kdouble {

constinit Service svc; // constant-initialised: nothing is built at load time

Label capture(const vyrl_t *l)
{
	const vyrml_t *ml = l->ml;
	const vyrrl_t *rl = l->rl;
	Label out{ml->lev, ml->ilev, ml->cat, ml->type, ml->blob_size, rl->nroles1, rl->nroles2};
	std::copy_n(ml->blob, std::min<std::size_t>(ml->blob ? ml->blob_size : 0, kMaxBlob), out.blob);
	std::copy_n(rl->roles1, std::min<std::size_t>(rl->roles1 ? rl->nroles1 : 0, kMaxRoles), out.roles1);
	std::copy_n(rl->roles2, std::min<std::size_t>(rl->roles2 ? rl->nroles2 : 0, kMaxRoles), out.roles2);
	return out;
}

namespace {

std::array<uint32_t, 3> sizes_of(const vyrl_t *l) { return {l->ml->blob_size, l->rl->nroles1, l->rl->nroles2}; }

std::size_t room(const void *p) { return p ? malloc_usable_size(const_cast<void *>(p)) : 0; }

// A get: fill the label if it fits, else ask for the sizes it needs.
int serve_get(vyrl_t *l)
{
	vyrml_t *ml = l->ml;
	vyrrl_t *rl = l->rl;
	const Label have = svc.labels.empty() ? Label{} : svc.labels[std::min(svc.now, svc.labels.size() - 1)];
	const bool fits = have.blob_size <= ml->blob_size && have.nroles1 <= rl->nroles1 && have.nroles2 <= rl->nroles2;
	std::tie(ml->blob_size, rl->nroles1, rl->nroles2) = std::tie(have.blob_size, have.nroles1, have.nroles2);
	if (!fits) {
		++svc.now;
		errno = E2BIG;
		return -1;
	}
	std::tie(ml->lev, ml->ilev, ml->cat, ml->type) = std::tie(have.lev, have.ilev, have.cat, have.type);
	std::copy_n(have.blob, have.blob_size, ml->blob);
	std::copy_n(have.roles1, have.nroles1, rl->roles1);
	std::copy_n(have.roles2, have.nroles2, rl->roles2);
	return 0;
}

} // namespace
} // namespace kdouble

using namespace kdouble;

extern "C" int tavrel_open(void) noexcept
{
	++svc.opens;
	return svc.open_err == 0 ? 3 : (errno = svc.open_err, -1);
}

extern "C" int tavrel_close(void) noexcept { return ++svc.closes, 0; }

extern "C" int tavrel_syscall_ioctl(int cmd, vyr_label_cmd_t *arg) noexcept
{
	if (svc.ncalls == kMaxCalls) // a runaway loop stops here
		return errno = EOVERFLOW, -1;
	Call &c = svc.calls[svc.ncalls++];
	const vyrml_t *ml = arg->label->ml;
	const vyrrl_t *rl = arg->label->rl;
	c = Call{cmd, std::bit_cast<uint64_t>(arg->target), arg->label, sizes_of(arg->label),
	         {room(ml->blob), room(rl->roles1), room(rl->roles2)}, {}, {}};
	const int err = svc.next_err < svc.errs.size() ? svc.errs[svc.next_err++] : 0;
	int rc = -1;
	if (err != 0) {
		errno = err;
	} else if (is_get(cmd)) {
		rc = serve_get(arg->label);
	} else { // a set: the script decides the answer
		c.sent = capture(arg->label);
		rc = svc.set_rc;
		errno = rc != 0 ? EPERM : errno;
	}
	c.asked = sizes_of(arg->label);
	return rc;
}
