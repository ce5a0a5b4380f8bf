// The database set-up of the text benchmarks: the real `files` back-end with
// 256 level names ("level0".."level255") and 64 category names, one per bit
// ("cat0".."cat63"), in a fresh directory that is removed at exit.
#pragma once

#include <langinfo.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

namespace bench_repr {

// Writes the database files and points the databases at them, once per
// process and before the first database call.
inline void setup_files_backend()
{
	static bool done = false;
	if (done)
		return;
	done = true;
	char templ[] = "/tmp/vyr-text-bench-XXXXXX";
	if (mkdtemp(templ) == nullptr) {
		std::perror("mkdtemp");
		std::exit(1);
	}
	static const std::string dir = templ;
	std::atexit([] {
		std::error_code ec;
		std::filesystem::remove_all(dir, ec);
	});
	std::ofstream levels(dir + "/levels");
	for (int v = 0; v < 256; ++v)
		levels << "level" << v << ':' << v << '\n';
	std::ofstream categories(dir + "/categories");
	for (int bit = 0; bit < 64; ++bit)
		categories << "cat" << bit << ':' << std::hex << (1ull << bit) << std::dec << '\n';
	const char *charset = nl_langinfo(CODESET);
	std::ofstream(dir + "/dbroute.conf") << "lev_backend = files\nlev_charset = " << charset
	                                     << "\ncat_backend = files\ncat_charset = " << charset
	                                     << "\nfiles_dir = " << dir << '\n';
	setenv("VYR_DBROUTE_CONF", (dir + "/dbroute.conf").c_str(), 1);
}

} // namespace bench_repr
