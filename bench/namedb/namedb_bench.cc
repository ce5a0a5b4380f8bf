// Name database lookups through the `files` back-end: a level database of
// 256 levels and a category database of 64 categories in a temporary
// directory. The floor is one stat() of the level file, which any lookup
// that notices a changed file has to pay.

#include <vyr/namedb.h>

#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace {

constexpr int kLevels = 256;
constexpr int kCategories = 64;

struct Fixture {
	std::string dir;
	std::vector<std::string> cat_names;

	Fixture()
	{
		char tmpl[] = "/tmp/vyr-namedb-bench-XXXXXX";
		if (!mkdtemp(tmpl))
			std::abort();
		dir = tmpl;
		write("levels", [](FILE *f) {
			for (int i = 0; i < kLevels; ++i)
				std::fprintf(f, "level%03d:%d\n", i, i);
		});
		write("categories", [this](FILE *f) {
			for (int i = 0; i < kCategories; ++i) {
				cat_names.push_back("category" + std::to_string(i));
				std::fprintf(f, "%s:%llx\n", cat_names.back().c_str(), 1ull << i);
			}
		});
		write("users", [](FILE *f) { std::fprintf(f, "root:0:0:0:0\n"); });
		const std::string conf = dir + "/dbroute.conf";
		FILE *f = std::fopen(conf.c_str(), "w");
		if (!f)
			std::abort();
		for (const char *db : {"mac", "lev", "cat"})
			std::fprintf(f, "%s_backend = files\n%s_charset = UTF-8\n", db, db);
		std::fprintf(f, "files_dir = %s\n", dir.c_str());
		std::fclose(f);
		setenv("VYR_DBROUTE_CONF", conf.c_str(), 1);
	}

	~Fixture()
	{
		for (const char *name : {"levels", "categories", "users", "dbroute.conf"})
			unlink((dir + "/" + name).c_str());
		// The back-end may keep a lock file beside its databases.
		for (const char *name : {".lock", "levels.lock", "categories.lock", "users.lock"})
			unlink((dir + "/" + name).c_str());
		rmdir(dir.c_str());
	}

	template <class F>
	void write(const char *name, F &&fill)
	{
		FILE *f = std::fopen((dir + "/" + name).c_str(), "w");
		if (!f)
			std::abort();
		fill(f);
		std::fclose(f);
	}
};

Fixture &fixture()
{
	static Fixture f;
	return f;
}

void BM_getlevval_r(benchmark::State &state)
{
	fixture();
	void *db = openlevdb_r();
	if (!db) {
		state.SkipWithError("level database does not open");
		return;
	}
	int v = 0;
	for (auto _ : state) {
		levent_t *e = getlevval_r(db, v++ & 0xff);
		if (!e) {
			state.SkipWithError("level lookup failed");
			break;
		}
		benchmark::DoNotOptimize(e->name);
		freelevent_r(e);
	}
	closelevdb_r(db);
}
BENCHMARK(BM_getlevval_r);

void BM_getcatnam_r(benchmark::State &state)
{
	const auto &names = fixture().cat_names;
	void *db = opencatdb_r();
	if (!db) {
		state.SkipWithError("category database does not open");
		return;
	}
	size_t i = 0;
	for (auto _ : state) {
		catent_t *e = getcatnam_r(db, names[i++ % names.size()].c_str());
		if (!e) {
			state.SkipWithError("category lookup failed");
			break;
		}
		benchmark::DoNotOptimize(e->value);
		freecatent_r(e);
	}
	closecatdb_r(db);
}
BENCHMARK(BM_getcatnam_r);

// What label text pays per field: open, one lookup, close.
void BM_open_getlevval_close(benchmark::State &state)
{
	fixture();
	int v = 0;
	for (auto _ : state) {
		void *db = openlevdb_r();
		levent_t *e = db ? getlevval_r(db, v++ & 0xff) : nullptr;
		if (!e) {
			state.SkipWithError("open or lookup failed");
			break;
		}
		freelevent_r(e);
		closelevdb_r(db);
	}
}
BENCHMARK(BM_open_getlevval_close);

void BM_stat_floor(benchmark::State &state)
{
	const std::string path = fixture().dir + "/levels";
	struct stat st;
	for (auto _ : state)
		benchmark::DoNotOptimize(stat(path.c_str(), &st));
}
BENCHMARK(BM_stat_floor);

} // namespace

BENCHMARK_MAIN();
