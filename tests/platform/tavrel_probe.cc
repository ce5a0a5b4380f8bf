// tavrel_probe: reads or sets one label through libtavrel-base.so.2 from a
// process of its own, for the tests that check what another process sees.
//
//   tavrel_probe get path|lpath|fd|pid TARGET        prints the stored form in hex
//   tavrel_probe set path|lpath|fd|pid TARGET HEX    sets the label given in hex
//
// For fd the probe opens TARGET itself; pid 0 is the probe.  Exit status 0
// on success, else 1 with "errno N" on stdout.
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <string>
#include <string_view>
#include <unistd.h>
#include <vector>

#include "contract/tavrel_base.h"
#include "label_codec.hh"

namespace {

struct Records {
	vyrml_t ml{};
	vyrrl_t rl{};
	vyrl_t l{};
	std::vector<uint8_t> blob;
	std::vector<vyr_role_t> r1, r2;

	// Offers room for a label of up to n bytes stored.
	explicit Records(size_t n) : blob(n), r1(n / tavrel::kRoleSize), r2(n / tavrel::kRoleSize)
	{
		ml.blob = blob.data();
		ml.blob_size = static_cast<uint32_t>(blob.size());
		rl.roles1 = r1.data();
		rl.nroles1 = static_cast<uint32_t>(r1.size());
		rl.roles2 = r2.data();
		rl.nroles2 = static_cast<uint32_t>(r2.size());
		l.ml = &ml;
		l.rl = &rl;
	}
};

int fail(int err)
{
	std::printf("errno %d\n", err);
	return 1;
}

bool parse_hex(std::string_view hex, std::vector<uint8_t> *out)
{
	if (hex.size() % 2)
		return false;
	for (size_t i = 0; i < hex.size(); i += 2) {
		char pair[3] = {hex[i], hex[i + 1], 0};
		char *end = nullptr;
		out->push_back(static_cast<uint8_t>(std::strtoul(pair, &end, 16)));
		if (*end)
			return false;
	}
	return true;
}

int command_for(std::string_view op, std::string_view kind)
{
	const bool set = op == "set";
	if (kind == "path")
		return set ? TAVREL_CMD_SET_PATH : TAVREL_CMD_GET_PATH;
	if (kind == "lpath")
		return set ? TAVREL_CMD_SET_LPATH : TAVREL_CMD_GET_LPATH;
	if (kind == "fd")
		return set ? TAVREL_CMD_SET_FD : TAVREL_CMD_GET_FD;
	if (kind == "pid")
		return set ? TAVREL_CMD_SET_PID : TAVREL_CMD_GET_PID;
	return -1;
}

} // namespace

int main(int argc, char **argv)
{
	if (argc < 4 || (std::string_view(argv[1]) == "set" && argc < 5)) {
		std::fprintf(stderr, "usage: tavrel_probe get|set path|lpath|fd|pid TARGET [HEX]\n");
		return 2;
	}
	const std::string_view op = argv[1], kind = argv[2];
	const int cmd = command_for(op, kind);
	if (cmd < 0 || (op != "get" && op != "set"))
		return 2;

	vyr_label_cmd_t arg{};
	int fd = -1;
	if (kind == "fd") {
		fd = open(argv[3], O_RDONLY | O_CLOEXEC);
		if (fd < 0)
			return fail(errno);
		arg.target.num = fd;
	} else if (kind == "pid") {
		arg.target.num = std::strtoll(argv[3], nullptr, 10);
	} else {
		arg.target.path = argv[3];
	}
	if (tavrel_open() < 0)
		return fail(errno);

	if (op == "set") {
		std::vector<uint8_t> form;
		tavrel::StoredLabel stored;
		if (!parse_hex(argv[4], &form) || tavrel::decode_label(form.data(), form.size(), &stored) != 0)
			return 2;
		Records rec(form.size());
		if (tavrel::fill_label(stored, &rec.l) != 0)
			return 2;
		arg.label = &rec.l;
		return tavrel_syscall_ioctl(cmd, &arg) == 0 ? 0 : fail(errno);
	}

	Records rec(tavrel::kMaxFormSize);
	arg.label = &rec.l;
	if (tavrel_syscall_ioctl(cmd, &arg) != 0)
		return fail(errno);
	std::vector<uint8_t> form(tavrel::encoded_size(&rec.l));
	tavrel::encode_label(&rec.l, form.data());
	for (uint8_t b : form)
		std::printf("%02x", b);
	std::printf("\n");
	return 0;
}
