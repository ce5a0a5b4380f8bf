// vyr: show, set and decide on security labels from the command line.
//
//   vyr [--json] [--version] [--help] COMMAND [OPTIONS] [ARGS]
#include "commands.hh"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <obstack.h>

namespace {

// The library builds label text on obstacks, whose allocation failure
// handler never returns; end the way every other failure of the tool reads.
[[noreturn]] void obstack_out_of_memory()
{
	std::fprintf(stderr, "vyr: %s\n", std::strerror(ENOMEM));
	std::exit(vyr::tool::kFailure);
}

} // namespace

int main(int argc, char **argv)
{
	obstack_alloc_failed_handler = obstack_out_of_memory;
	// Lines reach a pipe in step with the messages on stderr.
	std::setvbuf(stdout, nullptr, _IOLBF, 0);
	return vyr::tool::tool_main(argc, argv);
}
