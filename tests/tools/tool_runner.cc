#include "tool_runner.hh"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <stdexcept>

#include <fcntl.h>
#include <ftw.h>
#include <grp.h>
#include <poll.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

extern char **environ;

namespace vyr_tool_test {

namespace {

// The process's environment with `extra` applied in order: an entry whose
// name is already there replaces it.
std::vector<std::string> merged_environment(const std::vector<std::string> &extra)
{
	std::vector<std::string> env;
	for (char **e = environ; *e != nullptr; ++e)
		env.emplace_back(*e);
	for (const auto &x : extra) {
		const std::string name = x.substr(0, x.find('=') + 1);
		bool replaced = false;
		for (auto &e : env)
			if (e.compare(0, name.size(), name) == 0) {
				e = x;
				replaced = true;
			}
		if (!replaced)
			env.push_back(x);
	}
	return env;
}

// In the child: wire the pipes, drop privileges if asked, exec.  Never returns.
[[noreturn]] void exec_child(const std::string &program, std::vector<char *> &argv,
                             std::vector<char *> &envp, int in_fd, int out_fd, int err_fd,
                             bool as_nobody)
{
	dup2(in_fd, STDIN_FILENO);
	dup2(out_fd, STDOUT_FILENO);
	dup2(err_fd, STDERR_FILENO);
	if (as_nobody && (setgroups(0, nullptr) != 0 || setgid(65534) != 0 || setuid(65534) != 0))
		_exit(125);
	execve(program.c_str(), argv.data(), envp.data());
	std::fprintf(stderr, "exec %s: %s\n", program.c_str(), std::strerror(errno));
	_exit(124);
}

// Feeds input and drains both output pipes until the child closes them.
void pump(int in_fd, int out_fd, int err_fd, const std::string &input, Result *r)
{
	size_t written = 0;
	if (input.empty()) {
		close(in_fd);
		in_fd = -1;
	}
	int open_outputs = 2;
	while (open_outputs > 0) {
		pollfd fds[3] = {{out_fd, POLLIN, 0}, {err_fd, POLLIN, 0}, {in_fd, POLLOUT, 0}};
		if (poll(fds, in_fd >= 0 ? 3 : 2, 30000) <= 0)
			break;
		for (int k = 0; k < 2; ++k) {
			if (fds[k].fd < 0 || !(fds[k].revents & (POLLIN | POLLHUP | POLLERR)))
				continue;
			char buf[4096];
			const ssize_t n = read(fds[k].fd, buf, sizeof buf);
			if (n > 0) {
				(k == 0 ? r->out : r->err).append(buf, static_cast<size_t>(n));
			} else {
				close(fds[k].fd);
				(k == 0 ? out_fd : err_fd) = -1;
				--open_outputs;
			}
		}
		if (in_fd >= 0 && (fds[2].revents & (POLLOUT | POLLERR | POLLHUP))) {
			const ssize_t n = write(in_fd, input.data() + written, input.size() - written);
			if (n > 0)
				written += static_cast<size_t>(n);
			if (n <= 0 || written == input.size()) {
				close(in_fd);
				in_fd = -1;
			}
		}
	}
	for (int fd : {in_fd, out_fd, err_fd})
		if (fd >= 0)
			close(fd);
}

} // namespace

Result run_program(const std::string &program, const std::vector<std::string> &args,
                   const RunOptions &opt)
{
	std::vector<std::string> env = merged_environment(opt.env);
	std::vector<char *> argv{const_cast<char *>(program.c_str())};
	for (const auto &a : args)
		argv.push_back(const_cast<char *>(a.c_str()));
	argv.push_back(nullptr);
	std::vector<char *> envp;
	for (auto &e : env)
		envp.push_back(e.data());
	envp.push_back(nullptr);

	int in[2], out[2], err[2];
	if (pipe2(in, O_CLOEXEC) != 0 || pipe2(out, O_CLOEXEC) != 0 || pipe2(err, O_CLOEXEC) != 0)
		throw std::runtime_error("pipe failed");
	// A child that exits before reading its input must not kill us.
	signal(SIGPIPE, SIG_IGN);
	const pid_t pid = fork();
	if (pid < 0)
		throw std::runtime_error("fork failed");
	if (pid == 0)
		exec_child(program, argv, envp, in[0], out[1], err[1], opt.as_nobody);
	close(in[0]);
	close(out[1]);
	close(err[1]);
	Result r;
	pump(in[1], out[0], err[0], opt.input, &r);
	int ws = 0;
	waitpid(pid, &ws, 0);
	r.status = WIFEXITED(ws) ? WEXITSTATUS(ws) : 128 + WTERMSIG(ws);
	return r;
}

void remove_tree(const std::string &path)
{
	nftw(
	    path.c_str(),
	    [](const char *p, const struct stat *, int, struct FTW *) { return ::remove(p); }, 16,
	    FTW_DEPTH | FTW_PHYS);
}

void write_file(const std::string &path, std::string_view content)
{
	std::ofstream f(path, std::ios::binary | std::ios::trunc);
	f.write(content.data(), static_cast<std::streamsize>(content.size()));
	if (!f)
		throw std::runtime_error("cannot write " + path);
}

} // namespace vyr_tool_test
