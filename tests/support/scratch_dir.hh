// A private directory for one test, removed with everything in it when the
// test ends.  It lives under $TMPDIR (default /tmp), so a run can be pointed
// at a file system with the features a test needs (extended attributes).
#pragma once

#include <cstdio>
#include <cstdlib>
#include <ftw.h>
#include <string>

namespace vyr_test {

class ScratchDir {
public:
	ScratchDir()
	{
		const char *base = std::getenv("TMPDIR");
		std::string tmpl = std::string(base && *base ? base : "/tmp") + "/vyr-test-XXXXXX";
		if (mkdtemp(tmpl.data()))
			path_ = tmpl;
	}
	~ScratchDir()
	{
		if (!path_.empty())
			nftw(path_.c_str(), [](const char *p, const struct stat *, int, struct FTW *) { return std::remove(p); },
			     16, FTW_DEPTH | FTW_PHYS);
	}
	ScratchDir(const ScratchDir &) = delete;
	ScratchDir &operator=(const ScratchDir &) = delete;

	// False when the directory could not be made; path() is then empty.
	bool ok() const { return !path_.empty(); }
	const std::string &path() const { return path_; }
	std::string operator/(const std::string &name) const { return path_ + "/" + name; }

private:
	std::string path_;
};

} // namespace vyr_test
