#include "namedb/harness.hh"

#include "contract/dbroute.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <clocale>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dlfcn.h>
#include <fcntl.h>
#include <iconv.h>
#include <limits.h>
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

namespace {

char *field_of(const std::string &name)
{
	struct Field {
		const char *name;
		char *at;
	};
	const Field fields[] = {
		{"mac_backend", dbroute_cfg.mac_backend}, {"mac_charset", dbroute_cfg.mac_charset},
		{"lev_backend", dbroute_cfg.lev_backend}, {"lev_charset", dbroute_cfg.lev_charset},
		{"cat_backend", dbroute_cfg.cat_backend}, {"cat_charset", dbroute_cfg.cat_charset},
	};
	for (const Field &f : fields)
		if (name == f.name)
			return f.at;
	ADD_FAILURE() << "no configuration field " << name;
	std::abort();
}

std::string lib_dir()
{
	char exe[PATH_MAX];
	const ssize_t n = readlink("/proc/self/exe", exe, sizeof exe - 1);
	if (n <= 0)
		std::abort();
	exe[n] = '\0';
	std::string dir(exe);
	dir.erase(dir.rfind('/'));
	return dir + "/../lib/";
}

std::string file_of(const std::string &backend) { return "libtavrel-mac-db-" + backend + ".so.2"; }

} // namespace

void configure(const std::string &field, const std::string &value)
{
	char *at = field_of(field);
	if (value.size() >= DBROUTE_NAME_MAX)
		std::abort();
	std::memset(at, 0, DBROUTE_NAME_MAX);
	std::memcpy(at, value.data(), value.size());
}

void configure_default_entry(uint32_t on) { dbroute_cfg.mac_default_entry = on; }

void configure_all(const std::string &backend, const std::string &charset)
{
	for (const char *db : {"mac", "lev", "cat"}) {
		configure(std::string(db) + "_backend", backend);
		configure(std::string(db) + "_charset", charset);
	}
}

Plugin::Plugin(const std::string &backend) : backend_(backend)
{
	const std::string path = lib_dir() + file_of(backend);
	dl_ = dlopen(path.c_str(), RTLD_NOW);
	if (!dl_) {
		ADD_FAILURE() << "cannot load " << path << ": " << dlerror();
		std::abort();
	}
}

void *Plugin::sym(const char *entry) const
{
	const std::string name = backend_ + "_" + entry;
	void *p = dlsym(dl_, name.c_str());
	if (!p) {
		ADD_FAILURE() << "plug-in lacks " << name;
		std::abort();
	}
	return p;
}

void Plugin::reset() const { reinterpret_cast<void (*)()>(sym("ctl_reset"))(); }
void Plugin::knob(const char *key, long long value) const
{
	reinterpret_cast<void (*)(const char *, long long)>(sym("ctl_knob"))(key, value);
}
void Plugin::add_mac(const char *name, unsigned lev1, uint64_t cat1, unsigned lev2, uint64_t cat2,
		     long long uid) const
{
	reinterpret_cast<void (*)(const char *, unsigned, uint64_t, unsigned, uint64_t, long long)>(
		sym("ctl_add_mac"))(name, lev1, cat1, lev2, cat2, uid);
}
void Plugin::add_lev(const char *name, unsigned value) const
{
	reinterpret_cast<void (*)(const char *, unsigned)>(sym("ctl_add_lev"))(name, value);
}
void Plugin::add_cat(const char *name, uint64_t value) const
{
	reinterpret_cast<void (*)(const char *, uint64_t)>(sym("ctl_add_cat"))(name, value);
}
std::string Plugin::log() const { return reinterpret_cast<const char *(*)()>(sym("ctl_log"))(); }
void Plugin::clear_log() const { reinterpret_cast<void (*)()>(sym("ctl_clear_log"))(); }
long Plugin::live_handles() const { return reinterpret_cast<long (*)()>(sym("ctl_live_handles"))(); }
size_t Plugin::rows(Table t) const
{
	return reinterpret_cast<size_t (*)(int)>(sym("ctl_rows"))(static_cast<int>(t));
}

bool plugin_loaded(const std::string &backend)
{
	void *dl = dlopen(file_of(backend).c_str(), RTLD_NOW | RTLD_NOLOAD);
	if (dl)
		dlclose(dl);
	return dl != nullptr;
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

std::string capture_stderr(const std::function<void()> &body)
{
	std::fflush(stderr);
	FILE *tmp = std::tmpfile();
	if (!tmp)
		std::abort();
	const int saved = dup(STDERR_FILENO);
	dup2(fileno(tmp), STDERR_FILENO);
	body();
	std::fflush(stderr);
	dup2(saved, STDERR_FILENO);
	close(saved);
	std::string out;
	std::rewind(tmp);
	char buf[512];
	size_t n;
	while ((n = std::fread(buf, 1, sizeof buf, tmp)) > 0)
		out.append(buf, n);
	std::fclose(tmp);
	return out;
}

void use_utf8_locale()
{
	if (!std::setlocale(LC_ALL, "C.UTF-8")) {
		ADD_FAILURE() << "no C.UTF-8 locale";
		std::abort();
	}
}

std::string to_koi8r(const std::string &utf8)
{
	iconv_t cd = iconv_open("KOI8-R", "UTF-8");
	if (cd == reinterpret_cast<iconv_t>(-1))
		std::abort();
	std::string in = utf8;
	std::string out(in.size() * 4 + 4, '\0');
	char *ip = in.data(), *op = out.data();
	size_t il = in.size(), ol = out.size();
	if (iconv(cd, &ip, &il, &op, &ol) == static_cast<size_t>(-1))
		std::abort();
	iconv_close(cd);
	out.resize(out.size() - ol);
	return out;
}

} // namespace nd_test
