#include "namedb/harness.hh"

#include <gtest/gtest.h>

#include <cerrno>
#include <clocale>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <sys/wait.h>
#include <unistd.h>

// The configuration stand-in: libvyr binds to these definitions of the test
// program rather than to the configuration library's.
extern "C" {
dbroute_cfg_t dbroute_cfg;

int dbroute_init(void) noexcept
{
	++nd_test::g_init_calls;
	if (nd_test::g_init_result < 0)
		errno = EIO;
	return nd_test::g_init_result;
}
}

// Present only in sanitizer builds: lets a forked child, which ends with
// _exit, run the leak check that a normal exit would run.
extern "C" int __lsan_do_recoverable_leak_check() __attribute__((weak));

namespace nd_test {

int g_init_calls = 0;
int g_init_result = 0;

void set_field(char (&field)[DBROUTE_NAME_MAX], const std::string &value)
{
	if (value.size() >= DBROUTE_NAME_MAX)
		std::abort();
	std::memset(field, 0, sizeof field);
	std::memcpy(field, value.data(), value.size());
}

void configure_all(const char *backend, const char *charset)
{
	for (auto *f : {&dbroute_cfg.mac_backend, &dbroute_cfg.lev_backend, &dbroute_cfg.cat_backend})
		set_field(*f, backend);
	for (auto *f : {&dbroute_cfg.mac_charset, &dbroute_cfg.lev_charset, &dbroute_cfg.cat_charset})
		set_field(*f, charset);
}

void in_fresh_process(const std::function<void()> &body)
{
	std::fflush(nullptr);
	const pid_t pid = fork();
	ASSERT_GE(pid, 0) << std::strerror(errno);
	if (pid == 0) {
		body();
		if (__lsan_do_recoverable_leak_check && __lsan_do_recoverable_leak_check() != 0)
			ADD_FAILURE() << "memory leaked in the child process (report above)";
		std::fflush(nullptr);
		_exit(::testing::Test::HasFailure() ? 1 : 0);
	}
	int status = 0;
	ASSERT_EQ(waitpid(pid, &status, 0), pid);
	ASSERT_TRUE(WIFEXITED(status)) << "child ended by signal " << WTERMSIG(status);
	EXPECT_EQ(WEXITSTATUS(status), 0) << "the child process reported failures (see above)";
}

void with_memtest(const std::function<void()> &body, const char *charset, const char *cat_charset)
{
	in_fresh_process([&] {
		ASSERT_NE(std::setlocale(LC_ALL, "C.UTF-8"), nullptr);
		configure_all("memtest", cat_charset);
		set_field(dbroute_cfg.mac_charset, charset);
		set_field(dbroute_cfg.lev_charset, charset);
		// Start the databases ahead (a NULL name reaches no plug-in): the
		// loaded plug-in's blocks live on and must not be counted as
		// leaks of an allocation sweep.
		getmacnam_r(nullptr, nullptr);
		getlevnam_r(nullptr, nullptr);
		getcatnam_r(nullptr, nullptr);
		body();
	});
}

} // namespace nd_test
