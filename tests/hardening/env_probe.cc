// The trust tests' probe: prints what the configuration and service libraries
// made of the environment. It links them, not libvyr, since a set-user-ID
// program does not expand $ORIGIN in its libraries' run paths.
#include "contract/dbroute.h"
#include "contract/tavrel_base.h"

#include <cerrno>
#include <cstdio>
#include <sys/auxv.h>

// LeakSanitizer can't inspect a process running under another user id.
extern "C" const char *__asan_default_options() { return "detect_leaks=0"; }

int main()
{
	const int secure = static_cast<int>(getauxval(AT_SECURE));
	const int db_rc = dbroute_init();
	errno = 0;
	const int open_rc = tavrel_open();
	const int open_errno = open_rc == 0 ? 0 : errno;
	const char *backend = dbroute_cfg.lev_backend[0] ? dbroute_cfg.lev_backend : "-"; // not NUL-terminated when full
	std::printf("secure=%d dbroute=%d lev_backend=%.*s tavrel_open=%d errno=%d\n", secure, db_rc,
	            static_cast<int>(DBROUTE_NAME_MAX), backend, open_rc, open_errno);
	return std::fflush(stdout) == 0 ? 0 : 1;
}
