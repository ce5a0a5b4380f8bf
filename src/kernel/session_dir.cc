// Session directories: a directory named after a label that carries that
// label, created where missing and repaired where it has gone wrong.
#include <vyr/kernel.h>
#include <vyr/label.h>
#include <vyr/session.h>
#include <vyr/text.h>

#include "common/c_api.hh"
#include "repr/text_out.hh"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <sys/stat.h>
#include <unistd.h>

namespace vyr::kernel {
namespace {

struct LabelPut {
	void operator()(vyrl_t *l) const noexcept { vyrl_put(l); }
};
using LabelRef = std::unique_ptr<vyrl_t, LabelPut>;

using Text = vyr::malloc_ptr<char>;

// The forms of the path templates take a missing text as an empty one.
const char *or_empty(const char *s) noexcept { return s != nullptr ? s : ""; }

bool is_empty(const char *s) noexcept { return s == nullptr || *s == '\0'; }

// "a/b" as a new string, or NULL.  Measured first and allocated once, so
// that running out of memory here is an ordinary failure.
char *join(const char *a, const char *b) noexcept
{
	a = or_empty(a);
	b = or_empty(b);
	const size_t la = std::strlen(a);
	const size_t lb = std::strlen(b);
	auto *s = static_cast<char *>(std::malloc(la + 1 + lb + 1));
	if (s == nullptr)
		return nullptr;
	std::memcpy(s, a, la);
	s[la] = '/';
	std::memcpy(s + la + 1, b, lb + 1);
	return s;
}

// Step 1 of making a directory: leaves the path either absent or a
// directory (possibly through a symbolic link).  Returns 1 when a directory
// is already there, 0 when one must be made, and -1 on error.
int find_directory(const char *path) noexcept
{
	struct stat st;
	if (stat(path, &st) != 0)
		return errno == ENOENT ? 0 : -1;
	if (S_ISDIR(st.st_mode))
		return 1;
	if (unlink(path) != 0)
		return -1;
	return 0;
}

// mkdir with exactly `mode`: the process's creation mask is cleared for the
// one call and put back whatever mkdir gave.
int make_directory(const char *path, mode_t mode) noexcept
{
	const mode_t old_mask = umask(0);
	const int rc = mkdir(path, mode);
	const int saved = errno;
	umask(old_mask);
	errno = saved;
	return rc;
}

int repair_owner_and_mode(const char *path, uid_t uid, gid_t gid, mode_t mode) noexcept
{
	struct stat st;
	if (stat(path, &st) != 0)
		return -1;
	if (!S_ISDIR(st.st_mode))
		return -1; // something else took the path since the first look
	if ((st.st_uid != uid || st.st_gid != gid) && chown(path, uid, gid) != 0)
		return -1;
	if ((st.st_mode & 0777) != mode && chmod(path, mode) != 0)
		return -1;
	return 0;
}

// The label a directory must carry for `label`: a directory that holds a
// non-zero integrity level also gets the "ccnri" type bit.
int repair_label(const char *path, const vyrl_t *label) noexcept
{
	LabelRef present{vyr_get_path(path)};
	if (!present)
		return -1;
	LabelRef wanted{vyrl_dup(label)};
	if (!wanted)
		return -1;
	if (wanted->ml->ilev != 0)
		vyrl_or_type(wanted.get(), VYR_TYPE_CCNRI);
	if (vyrl_cmp(wanted.get(), present.get(), 0))
		return 0;
	return vyr_set_path(path, wanted.get()) == 0 ? 0 : -1;
}

// Points `name` inside the session directory at `target`.  A link that is
// there already, from an earlier session, is left as it is.
void link_back(const char *session, const char *name, const char *target) noexcept
{
	Text path{join(session, name)};
	if (path)
		(void)symlink(target, path.get());
}

} // namespace
} // namespace vyr::kernel

using namespace vyr::kernel;

extern "C" {

int vyrlugm_mkdir(const char *path, vyrl_t *label, uint32_t uid, uint32_t gid,
                  uint32_t mode) noexcept
{
	const int found = find_directory(path);
	if (found < 0)
		return -1;
	if (found == 0 && make_directory(path, mode) != 0)
		return -1;
	if (repair_owner_and_mode(path, uid, gid, mode) != 0)
		return -1;
	return repair_label(path, label);
}

char *vyrml_session_dir(const char *base, const char *sub, const vyrml_t *ml) noexcept
{
	return vyr::repr::build_text([&](struct obstack *o) {
		const int head = obstack_printf(o, "%s/%s/", or_empty(base), or_empty(sub));
		if (head < 0)
			return -1;
		// Numbers only: a path must not depend on the name databases.
		const int tail = vyrml_obstack_printf(ml, o, "l%Nli%Nic%Nct%Nt");
		return tail < 0 ? -1 : head + tail;
	});
}

char *vyrl_session_dir(const char *base, const char *sub, const vyrl_t *l) noexcept
{
	return vyrml_session_dir(base, sub, l->ml);
}

char *vyrlugm_make_session_dir(const char *base, const char *sub, const char *link,
                               vyrl_t *label, uint32_t uid, uint32_t gid,
                               uint32_t mode) noexcept
{
	// The parent base/sub carries the label of base.
	Text parent;
	if (!is_empty(sub)) {
		parent.reset(join(base, sub));
		if (!parent)
			return nullptr;
		LabelRef base_label{vyr_get_path(base)};
		if (!base_label)
			return nullptr;
		if (vyrlugm_mkdir(parent.get(), base_label.get(), uid, gid, mode) != 0)
			return nullptr;
	}

	// A session with links back to its parent is marked CCNRA; the mark does
	// not show in the path, which is formed from the caller's label.
	const bool with_links = !is_empty(link);
	LabelRef dir_label{with_links ? vyrl_dup(label) : vyrl_get(label)};
	if (!dir_label)
		return nullptr;
	if (with_links)
		vyrl_or_type(dir_label.get(), VYR_TYPE_CCNRA);

	Text session{vyrl_session_dir(base, sub, label)};
	if (!session)
		return nullptr;
	if (vyrlugm_mkdir(session.get(), dir_label.get(), uid, gid, mode) != 0)
		return nullptr;
	dir_label.reset();

	if (with_links) {
		const char *target = parent ? parent.get() : base;
		link_back(session.get(), link, target);
		link_back(session.get(), "vyr", target);
	}
	return session.release();
}

} // extern "C"
