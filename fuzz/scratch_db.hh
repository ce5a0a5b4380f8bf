// A scratch name database for the fuzz targets whose readers look names up:
// the files back-end's level and category files in a temporary directory,
// and a configuration naming them, announced through VYR_DBROUTE_CONF.
// Called from LLVMFuzzerInitialize, before the first database call. The
// directory is removed when the fuzzer exits.
#pragma once

#include <cstdio>
#include <cstdlib>
#include <string>
#include <unistd.h>

namespace vyr_fuzz {

inline std::string &scratch_dir()
{
	static std::string dir;
	return dir;
}

inline void write_scratch_file(const std::string &name, const std::string &content)
{
	FILE *f = std::fopen((scratch_dir() + "/" + name).c_str(), "w");
	if (f == nullptr)
		std::abort();
	std::fputs(content.c_str(), f);
	std::fclose(f);
}

inline void remove_scratch_db()
{
	for (const char *name : {"levels", "categories", "users", "dbroute.conf", "levels.lock", "categories.lock"})
		std::remove((scratch_dir() + "/" + name).c_str());
	::rmdir(scratch_dir().c_str());
}

// Names are not numbers, so a name never shadows the number it would read as.
inline void install_scratch_db()
{
	char dir[] = "/tmp/vyr-fuzz-db-XXXXXX";
	if (mkdtemp(dir) == nullptr)
		std::abort();
	scratch_dir() = dir;
	write_scratch_file("levels", "secret:3\ntop:200\nunclassified:0\n");
	write_scratch_file("categories", "finance:8\nhuman:10\nops:100000000\nlast:8000000000000000\n");
	write_scratch_file("users", "");
	write_scratch_file("dbroute.conf", "lev_backend = files\nlev_charset = UTF-8\ncat_backend = files\n"
	                                   "cat_charset = UTF-8\nfiles_dir = " + scratch_dir() + "\n");
	setenv("VYR_DBROUTE_CONF", (scratch_dir() + "/dbroute.conf").c_str(), 1);
	std::atexit(remove_scratch_db);
}

} // namespace vyr_fuzz
