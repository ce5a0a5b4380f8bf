// A scratch name database for the hardening tests: the three files of the
// files back-end in a temporary directory, and a configuration file naming
// them, announced to the library through VYR_DBROUTE_CONF.
//
// The databases start on their first call and keep their configuration for
// the life of the process, so a program installs one ScratchDb before its
// first database call and keeps it (each CTest case is a process of its own).
#pragma once

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <string>

#include <gtest/gtest.h>

#include "support/scratch_dir.hh"

namespace hardening {

inline std::string read_file(const std::string &path)
{
	std::ifstream in(path, std::ios::binary);
	return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

// Replaces a file in one step (new file, rename), as an editor would.
inline void install_file(const std::string &path, const std::string &text)
{
	const std::string tmp = path + ".new";
	{
		std::ofstream out(tmp, std::ios::binary | std::ios::trunc);
		out << text;
	}
	ASSERT_EQ(std::rename(tmp.c_str(), path.c_str()), 0) << path;
}

class ScratchDb {
public:
	static constexpr const char *kLevels = "unclassified:0\nsecret:3\ntop:200\n";
	static constexpr const char *kCategories = "finance:8\nhuman:10\nops:100000000\n";
	static constexpr const char *kUsers = "root:3:8:200:18\nalice:0:10:3:0\n";

	// Backend charset: when it differs from the locale's, every name passes
	// through a conversion, which adds allocations to each lookup.
	explicit ScratchDb(const char *charset = "UTF-8")
	{
		if (!dir_.ok())
			std::abort();
		install_file(path("levels"), kLevels);
		install_file(path("categories"), kCategories);
		install_file(path("users"), kUsers);
		std::string conf;
		for (const char *db : {"mac", "lev", "cat"}) {
			conf += std::string(db) + "_backend = files\n";
			conf += std::string(db) + "_charset = " + charset + "\n";
		}
		conf += "files_dir = " + dir_.path() + "\n";
		install_file(path("dbroute.conf"), conf);
		setenv("VYR_DBROUTE_CONF", path("dbroute.conf").c_str(), 1);
	}
	ScratchDb(const ScratchDb &) = delete;
	ScratchDb &operator=(const ScratchDb &) = delete;

	std::string path(const std::string &name) const { return dir_ / name; }
	const std::string &dir() const { return dir_.path(); }

private:
	vyr_test::ScratchDir dir_;
};

} // namespace hardening
