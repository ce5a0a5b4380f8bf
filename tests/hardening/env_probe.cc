// A tiny program for the trust tests: reads the name-database configuration
// and opens the label service channel, and prints what it saw, in one line:
//   secure=<AT_SECURE> dbroute=<rc> lev_backend=<text> tavrel_open=<rc> errno=<errno>
// The tests run it plainly and as a set-user-ID / set-group-ID copy, with
// the environment overrides of both platform libraries set.
//
// It links the two platform libraries directly (not libvyr): they are the
// ones that read the environment, and a set-user-ID program does not expand
// $ORIGIN in the run paths of the libraries it loads.
#include "contract/dbroute.h"
#include "contract/tavrel_base.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <sys/auxv.h>

// In sanitizer builds: LeakSanitizer can't inspect a process that runs
// under another user id and would end the set-ID runs with a fatal error.
// The probe allocates nothing worth checking. (Unused in other builds.)
extern "C" const char *__asan_default_options() { return "detect_leaks=0"; }

int main()
{
	const int secure = static_cast<int>(getauxval(AT_SECURE));
	const int db_rc = dbroute_init();
	char backend[DBROUTE_NAME_MAX + 1] = {};
	std::memcpy(backend, dbroute_cfg.lev_backend, DBROUTE_NAME_MAX);
	errno = 0;
	const int open_rc = tavrel_open();
	const int open_errno = errno;
	std::printf("secure=%d dbroute=%d lev_backend=%s tavrel_open=%d errno=%d\n", secure, db_rc,
	            backend[0] ? backend : "-", open_rc, open_rc == 0 ? 0 : open_errno);
	return std::fflush(stdout) == 0 ? 0 : 1;
}
