// Opening and closing the channel.
//
// Environment (read with secure_getenv, so a setuid or setgid program is not
// steered by its caller):
//   VYR_TAVREL_XATTR_NS   namespace of the file label attribute: "security"
//                         (default), "trusted" or "user"
//   VYR_TAVREL_STATE_DIR  directory of the process label records (absolute;
//                         default TAVREL_DEFAULT_STATE_DIR)
#include "channel.hh"

#include <atomic>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <pthread.h>
#include <string_view>

#ifndef TAVREL_DEFAULT_STATE_DIR
#define TAVREL_DEFAULT_STATE_DIR "/run/tavrel"
#endif

namespace tavrel {
namespace {

constexpr std::string_view kAttrSuffix = ".vyrlabel";
constexpr std::string_view kNamespaces[] = {"security", "trusted", "user"};
// Room left in a path under the state directory for a record's file name.
constexpr size_t kRecordNameRoom = 64;

// All of it is constant-initialised: nothing runs at load time.
struct State {
	pthread_mutex_t lock = PTHREAD_MUTEX_INITIALIZER;  // serialises open and close
	std::atomic<bool> open{false}; // set last by open, cleared first by close
	char attr_name[32] = {};
	char state_dir[PATH_MAX - kRecordNameRoom] = {};
	Config config{attr_name, state_dir};
};
constinit State g_state;

bool known_namespace(std::string_view ns) noexcept
{
	for (std::string_view known : kNamespaces)
		if (ns == known)
			return true;
	return false;
}

// Reads the environment into the state: 0, or an errno value.
int load_config(State &st) noexcept
{
	const char *ns = secure_getenv("VYR_TAVREL_XATTR_NS");
	if (!ns || !*ns)
		ns = "security";
	if (!known_namespace(ns))
		return EINVAL;
	const char *dir = secure_getenv("VYR_TAVREL_STATE_DIR");
	if (!dir || !*dir)
		dir = TAVREL_DEFAULT_STATE_DIR;
	const size_t dir_len = std::strlen(dir);
	if (dir[0] != '/')
		return EINVAL;
	if (dir_len >= sizeof st.state_dir)
		return ENAMETOOLONG;
	std::string_view nsv(ns);
	static_assert(sizeof st.attr_name > 8 + kAttrSuffix.size());
	std::memcpy(st.attr_name, nsv.data(), nsv.size());
	std::memcpy(st.attr_name + nsv.size(), kAttrSuffix.data(), kAttrSuffix.size());
	st.attr_name[nsv.size() + kAttrSuffix.size()] = '\0';
	std::memcpy(st.state_dir, dir, dir_len + 1);
	return 0;
}

} // namespace

int channel_open() noexcept
{
	if (g_state.open.load(std::memory_order_acquire))
		return 0;
	pthread_mutex_lock(&g_state.lock);
	int err = 0;
	if (!g_state.open.load(std::memory_order_relaxed)) {
		err = load_config(g_state);
		if (!err)
			g_state.open.store(true, std::memory_order_release);
	}
	pthread_mutex_unlock(&g_state.lock);
	if (err) {
		errno = err;
		return -1;
	}
	return 0;
}

void channel_close() noexcept
{
	pthread_mutex_lock(&g_state.lock);
	g_state.open.store(false, std::memory_order_release);
	pthread_mutex_unlock(&g_state.lock);
}

const Config *channel_config() noexcept
{
	return g_state.open.load(std::memory_order_acquire) ? &g_state.config : nullptr;
}

} // namespace tavrel
