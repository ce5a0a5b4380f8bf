// Back-end of the test program: none. The configured name starts with the
// word that stands for "no plug-in", so every database open fails (ENOSYS).
#include "repr/textin_support.hh"

namespace textin_test {

const Backend &backend()
{
	static const Backend b = [] {
		configure_databases("fileses");
		return Backend{"fileses", false, false};
	}();
	return b;
}

} // namespace textin_test
