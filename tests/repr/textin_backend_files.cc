// Back-end of the test program: the real `files` plug-in, over a fresh
// directory holding the same names as the in-memory back-end.
#include <fstream>
#include <iomanip>
#include <string>

#include "repr/textin_support.hh"

namespace textin_test {

const Backend &backend()
{
	static const Backend b = [] {
		const std::string dir = make_temp_dir();
		std::ofstream levels(dir + "/levels");
		for (const LevelName &l : kLevels)
			levels << l.name << ':' << unsigned(l.value) << '\n';
		std::ofstream categories(dir + "/categories");
		for (const CategoryName &c : kCategories)
			categories << c.name << ':' << std::hex << c.value << std::dec << '\n';
		levels.close();
		categories.close();
		configure_databases("files", "files_dir = " + dir + "\n");
		return Backend{"files", true, false};
	}();
	return b;
}

} // namespace textin_test
