// Helpers for the tests of the label service stand-in: labels as plain
// values, label records with chosen room, and the command calls.
#pragma once

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <ostream>
#include <string>
#include <sys/xattr.h>
#include <unistd.h>
#include <vector>

#include <gtest/gtest.h>

#include "contract/tavrel_base.h"
#include "label_codec.hh"

// Field by field: the padding of a role entry holds nothing.
inline bool operator==(const vyr_role_t &a, const vyr_role_t &b)
{
	return a.id == b.id && a.attr == b.attr && a.rights == b.rights;
}

namespace tavrel_test {

// A label as plain values.
struct Label {
	uint8_t lev = 0;
	uint8_t ilev = 0;
	uint64_t cat = 0;
	uint16_t type = 0;
	std::vector<uint8_t> blob;
	std::vector<vyr_role_t> roles1;
	std::vector<vyr_role_t> roles2;
	bool operator==(const Label &) const = default;
};

inline std::ostream &operator<<(std::ostream &os, const Label &l)
{
	return os << "{lev " << int(l.lev) << ", ilev " << int(l.ilev) << ", cat " << l.cat << ", type " << l.type
	          << ", blob " << l.blob.size() << " bytes, roles " << l.roles1.size() << "+" << l.roles2.size() << "}";
}

// Label records as the service sees them, with buffers owned here.  Fields
// start at a sentinel, so a test can tell what the service wrote.
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
		std::copy(v.roles1.begin(), v.roles1.end(), r1.begin());
		std::copy(v.roles2.begin(), v.roles2.end(), r2.begin());
	}

	// The label the records now hold, by their counts.
	Label value() const
	{
		Label v{ml.lev, ml.ilev, ml.cat, ml.type, {}, {}, {}};
		if (ml.blob)
			v.blob.assign(ml.blob, ml.blob + ml.blob_size);
		if (rl.roles1)
			v.roles1.assign(rl.roles1, rl.roles1 + rl.nroles1);
		if (rl.roles2)
			v.roles2.assign(rl.roles2, rl.roles2 + rl.nroles2);
		return v;
	}
};

// The stored form of a label, as the service writes it.
inline std::vector<uint8_t> encode(const Label &v)
{
	Records r;
	r.assign(v);
	std::vector<uint8_t> out(tavrel::encoded_size(&r.l));
	tavrel::encode_label(&r.l, out.data());
	return out;
}

// Runs one command; returns 0 or the errno value of a failure.  Reports
// nothing through gtest, so forked children may use it.
inline int run(int cmd, vyr_label_cmd_t arg)
{
	errno = 0;
	const int rc = tavrel_syscall_ioctl(cmd, &arg);
	if (rc == 0)
		return 0;
	return rc == -1 && errno ? errno : -1;  // -1: not the documented failure
}

inline vyr_label_cmd_t arg(const std::string &path, Records &r)
{
	vyr_label_cmd_t a{};
	a.target.path = path.c_str();
	a.label = &r.l;
	return a;
}

inline vyr_label_cmd_t arg(int64_t num, Records &r)
{
	vyr_label_cmd_t a{};
	a.target.num = num;
	a.label = &r.l;
	return a;
}

// Reads a label the way libvyr does: an empty offer first, then exactly the
// room asked for, until the answer is not E2BIG.  Returns the errno value of
// the last answer, and the label on success.
inline int get_label(int cmd, vyr_label_cmd_t a, Records &r, Label *out)
{
	r.offer(0, 0, 0);
	int err;
	for (int pass = 0; (err = run(cmd, a)) == E2BIG && pass < 8; ++pass)
		r.offer(r.ml.blob_size, r.rl.nroles1, r.rl.nroles2);
	if (err == 0)
		*out = r.value();
	return err;
}

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
