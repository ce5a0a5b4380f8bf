// Back-end of the test program: the in-memory plug-in "textinmem".
#include "repr/textin_memdb.h"
#include "repr/textin_support.hh"

namespace textin_test {

const Backend &backend()
{
	static const Backend b = [] {
		configure_databases("textinmem");
		textinmem_reset();
		for (const LevelName &l : kLevels)
			textinmem_add_level(l.name, l.value);
		for (const CategoryName &c : kCategories)
			textinmem_add_category(c.name, c.value);
		return Backend{"textinmem", true, true};
	}();
	return b;
}

} // namespace textin_test
