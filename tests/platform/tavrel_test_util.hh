// Helpers for the tests of the platform stand-ins: labels built from plain
// values, label records with chosen room, and a scratch directory on a file
// system that keeps extended attributes.
#pragma once

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <ftw.h>
#include <string>
#include <sys/xattr.h>
#include <unistd.h>
#include <vector>

#include <gtest/gtest.h>

#include "contract/tavrel_base.h"

namespace tavrel_test {

struct Role {
	uint64_t id;
	uint32_t attr;
	uint8_t rights;
	bool operator==(const Role &) const = default;
};

// A label as plain values.
struct Label {
	uint8_t lev = 0;
	uint8_t ilev = 0;
	uint64_t cat = 0;
	uint16_t type = 0;
	std::vector<uint8_t> blob;
	std::vector<Role> roles1;
	std::vector<Role> roles2;
	bool operator==(const Label &) const = default;
};

inline std::ostream &operator<<(std::ostream &os, const Label &l)
{
	os << "{lev " << int(l.lev) << ", ilev " << int(l.ilev) << ", cat " << l.cat << ", type " << l.type
	   << ", blob " << l.blob.size() << " bytes, roles " << l.roles1.size() << "+" << l.roles2.size() << "}";
	return os;
}

// Label records as the service sees them, with buffers owned here.  The
// room offered is set with offer(); fields start at sentinel values so a
// test can tell what the service wrote.
struct Records {
	vyrml_t ml{};
	vyrrl_t rl{};
	vyrl_t l{};
	std::vector<uint8_t> blob;
	std::vector<vyr_role_t> r1, r2;

	static constexpr uint8_t kSentinel = 0xa5;

	Records()
	{
		std::memset(&ml, kSentinel, sizeof ml);
		std::memset(&rl, kSentinel, sizeof rl);
		l.ml = &ml;
		l.rl = &rl;
		l.ucnt = 1;
		offer(0, 0, 0);
	}
	Records(const Records &) = delete;

	// Offers buffers of these sizes (NULL for a size of 0).
	void offer(uint32_t blob_room, uint32_t n1, uint32_t n2)
	{
		blob.assign(blob_room, kSentinel);
		r1.assign(n1, vyr_role_t{});
		r2.assign(n2, vyr_role_t{});
		ml.blob = blob_room ? blob.data() : nullptr;
		ml.blob_size = blob_room;
		rl.roles1 = n1 ? r1.data() : nullptr;
		rl.nroles1 = n1;
		rl.roles2 = n2 ? r2.data() : nullptr;
		rl.nroles2 = n2;
	}

	// Sets the records to a label, as a caller of a set command would.
	void assign(const Label &v)
	{
		offer(static_cast<uint32_t>(v.blob.size()), static_cast<uint32_t>(v.roles1.size()),
		      static_cast<uint32_t>(v.roles2.size()));
		ml.lev = v.lev;
		ml.ilev = v.ilev;
		ml.cat = v.cat;
		ml.type = v.type;
		std::copy(v.blob.begin(), v.blob.end(), blob.begin());
		for (size_t i = 0; i < v.roles1.size(); ++i)
			r1[i] = vyr_role_t{v.roles1[i].id, v.roles1[i].attr, v.roles1[i].rights};
		for (size_t i = 0; i < v.roles2.size(); ++i)
			r2[i] = vyr_role_t{v.roles2[i].id, v.roles2[i].attr, v.roles2[i].rights};
	}

	// The label the records now hold, by their counts.
	Label value() const
	{
		Label v{ml.lev, ml.ilev, ml.cat, ml.type, {}, {}, {}};
		if (ml.blob)
			v.blob.assign(ml.blob, ml.blob + ml.blob_size);
		for (uint32_t i = 0; rl.roles1 && i < rl.nroles1; ++i)
			v.roles1.push_back({rl.roles1[i].id, rl.roles1[i].attr, rl.roles1[i].rights});
		for (uint32_t i = 0; rl.roles2 && i < rl.nroles2; ++i)
			v.roles2.push_back({rl.roles2[i].id, rl.roles2[i].attr, rl.roles2[i].rights});
		return v;
	}
};

// Runs one command on the records; returns 0 or the errno value.
inline int run(int cmd, vyr_label_cmd_t arg)
{
	errno = 0;
	const int rc = tavrel_syscall_ioctl(cmd, &arg);
	if (rc == 0)
		return 0;
	EXPECT_EQ(rc, -1);
	return errno;
}

inline vyr_label_cmd_t path_arg(const std::string &path, Records &r)
{
	vyr_label_cmd_t a{};
	a.target.path = path.c_str();
	a.label = &r.l;
	return a;
}

inline vyr_label_cmd_t num_arg(int64_t num, Records &r)
{
	vyr_label_cmd_t a{};
	a.target.num = num;
	a.label = &r.l;
	return a;
}

// Sets a label and checks the command succeeded.
inline void set_ok(int cmd, vyr_label_cmd_t arg)
{
	ASSERT_EQ(run(cmd, arg), 0);
}

// Reads a label the way libvyr does: an empty offer first, then exactly the
// room asked for, until the answer is not E2BIG.  Returns the errno value of
// the last answer, and the label on success.
inline int get_label(int cmd, vyr_label_cmd_t arg, Records &r, Label *out, int *passes = nullptr)
{
	r.offer(0, 0, 0);
	int err;
	int n = 0;
	while ((err = run(cmd, arg)) == E2BIG && n < 8) {
		++n;
		r.offer(r.ml.blob_size, r.rl.nroles1, r.rl.nroles2);
	}
	if (passes)
		*passes = n + 1;
	if (err == 0)
		*out = r.value();
	return err;
}

// A fresh directory removed with everything in it at the end.
class ScratchDir {
public:
	ScratchDir()
	{
		const char *base = std::getenv("TMPDIR");
		std::string tmpl = std::string(base && *base ? base : "/tmp") + "/tavrel-test-XXXXXX";
		std::vector<char> buf(tmpl.begin(), tmpl.end());
		buf.push_back('\0');
		if (mkdtemp(buf.data()))
			path_ = buf.data();
	}
	~ScratchDir()
	{
		if (!path_.empty())
			nftw(path_.c_str(), [](const char *p, const struct stat *, int, struct FTW *) { return ::remove(p); },
			     16, FTW_DEPTH | FTW_PHYS);
	}
	ScratchDir(const ScratchDir &) = delete;

	bool ok() const { return !path_.empty(); }
	const std::string &path() const { return path_; }
	std::string operator/(const std::string &name) const { return path_ + "/" + name; }

private:
	std::string path_;
};

// Whether `dir` keeps extended attributes of namespace `ns` on regular files
// (and on symbolic links too when `on_links`).
inline bool supports_xattr(const std::string &dir, const std::string &ns, bool on_links)
{
	const std::string file = dir + "/.probe", link = dir + "/.probe-link";
	FILE *f = std::fopen(file.c_str(), "w");
	if (!f)
		return false;
	std::fclose(f);
	const std::string name = ns + ".tavrel-probe";
	bool ok = setxattr(file.c_str(), name.c_str(), "1", 1, 0) == 0;
	if (ok && on_links) {
		ok = symlink(".probe", link.c_str()) == 0 && lsetxattr(link.c_str(), name.c_str(), "1", 1, 0) == 0;
		unlink(link.c_str());
	}
	unlink(file.c_str());
	return ok;
}

} // namespace tavrel_test
