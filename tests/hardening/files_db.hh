// Files for the hardening tests, and a scratch files-back-end database that
// a program makes before its first database call: the databases keep the
// configuration they start with.
#pragma once

#include "support/scratch_dir.hh"

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <string>

namespace hardening {

inline std::string read_file(const std::string &path)
{
	std::ifstream in(path, std::ios::binary);
	return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

// Replaces a file in one step (new file, rename), as an editor would.
inline void install_file(const std::string &path, const std::string &text)
{
	std::ofstream(path + ".new", std::ios::binary | std::ios::trunc) << text;
	ASSERT_EQ(std::rename((path + ".new").c_str(), path.c_str()), 0) << path;
}

constexpr const char *kLevels = "unclassified:0\nsecret:3\ntop:200\n";
constexpr const char *kCategories = "finance:8\nhuman:10\nops:100000000\n";
constexpr const char *kUsers = "root:3:8:200:18\nalice:0:10:3:0\n";

// A path in the process's scratch database, made on the first call.
inline std::string scratch_db(const std::string &name)
{
	static const vyr_test::ScratchDir dir;
	static const bool made = [] {
		install_file(dir / "levels", kLevels);
		install_file(dir / "categories", kCategories);
		install_file(dir / "users", kUsers);
		install_file(dir / "dbroute.conf", "mac_backend = files\nmac_charset = UTF-8\nlev_backend = files\n"
		                                   "lev_charset = UTF-8\ncat_backend = files\ncat_charset = UTF-8\n"
		                                   "files_dir = " + dir.path() + "\n");
		return setenv("VYR_DBROUTE_CONF", (dir / "dbroute.conf").c_str(), 1) == 0;
	}();
	return made ? dir / name : "";
}

} // namespace hardening
