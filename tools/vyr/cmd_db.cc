// lev, cat, user: list, get, add and remove entries of the three name
// databases through the configured back-end.
//
// One driver serves the three databases; what differs (record type, how a
// value is written and read, how an entry is built) lives in a traits struct
// per database.
#include "commands.hh"
#include "json.hh"

#include <cerrno>
#include <cstdio>
#include <string>
#include <vector>

namespace vyr::tool {

namespace {

std::string hex_text(uint64_t v)
{
	char buf[24];
	std::snprintf(buf, sizeof buf, "0x%llx", static_cast<unsigned long long>(v));
	return buf;
}

// The end of an add: the back-end's answer as an exit status.
int put_status(int rc, const char *what, const std::string &name)
{
	if (rc == 0)
		return kOk;
	report_errno(std::string(what) + " '" + name + "'", errno);
	return kFailure;
}

struct LevDb {
	using Ent = levent_t;
	static constexpr const char *kCommand = "lev";
	static constexpr const char *kWhat = "level";
	static constexpr const char *kDatabase = "level database";
	static constexpr const char *kAddUsage = "add NAME VALUE";
	static constexpr size_t kAddArgs = 2;

	static void *open() { return openlevdb_r(); }
	static int close(void *db) { return closelevdb_r(db); }
	static int rewind(void *db) { return setlevent_r(db); }
	static int end(void *db) { return endlevent_r(db); }
	static Ent *next(void *db) { return getlevent_r(db); }
	static void release(Ent *e) { freelevent_r(e); }
	static Ent *by_name(void *db, const std::string &k) { return getlevnam_r(db, k.c_str()); }
	static int rm_name(void *db, const std::string &k) { return rmlevnam_r(db, k.c_str()); }

	static std::optional<uint64_t> value_of(const std::string &k) { return parse_decimal(k, 255); }
	static Ent *by_value(void *db, uint64_t v) { return getlevval_r(db, static_cast<int>(v)); }
	static int rm_value(void *db, uint64_t v) { return rmlevval_r(db, static_cast<int>(v)); }

	static void text(const Ent *e, bool) { std::printf("%s\t%u\n", e->name, e->value); }
	static void json(JsonWriter &j, const Ent *e)
	{
		j.begin_object();
		j.key("name").string(e->name);
		j.key("value").number(e->value);
		j.end_object();
	}

	// NAME VALUE
	static int add(void *db, const std::vector<std::string> &a)
	{
		const auto v = parse_decimal(a[1], 255);
		if (!v)
			return usage_error(kCommand, "level value '" + a[1] + "' is not 0 to 255");
		levent_t ent{const_cast<char *>(a[0].c_str()), static_cast<uint8_t>(*v)};
		return put_status(putlevent_r(db, &ent), kWhat, a[0]);
	}
};

struct CatDb {
	using Ent = catent_t;
	static constexpr const char *kCommand = "cat";
	static constexpr const char *kWhat = "category";
	static constexpr const char *kDatabase = "category database";
	static constexpr const char *kAddUsage = "add NAME VALUE";
	static constexpr size_t kAddArgs = 2;

	static void *open() { return opencatdb_r(); }
	static int close(void *db) { return closecatdb_r(db); }
	static int rewind(void *db) { return setcatent_r(db); }
	static int end(void *db) { return endcatent_r(db); }
	static Ent *next(void *db) { return getcatent_r(db); }
	static void release(Ent *e) { freecatent_r(e); }
	static Ent *by_name(void *db, const std::string &k) { return getcatnam_r(db, k.c_str()); }
	static int rm_name(void *db, const std::string &k) { return rmcatnam_r(db, k.c_str()); }

	static std::optional<uint64_t> value_of(const std::string &k) { return parse_hex(k); }
	static Ent *by_value(void *db, uint64_t v) { return getcatval_r(db, v); }
	static int rm_value(void *db, uint64_t v) { return rmcatval_r(db, v); }

	static void text(const Ent *e, bool) { std::printf("%s\t%s\n", e->name, hex_text(e->value).c_str()); }
	static void json(JsonWriter &j, const Ent *e)
	{
		j.begin_object();
		j.key("name").string(e->name);
		j.key("value").string(hex_text(e->value));
		j.end_object();
	}

	// NAME VALUE; a category stands for one bit of the mask.
	static int add(void *db, const std::vector<std::string> &a)
	{
		const auto v = parse_hex(a[1]);
		if (!v || *v == 0 || (*v & (*v - 1)) != 0)
			return usage_error(kCommand, "category value '" + a[1] +
			                                 "' is not a hexadecimal mask of exactly one bit");
		catent_t ent{const_cast<char *>(a[0].c_str()), *v};
		return put_status(putcatent_r(db, &ent), kWhat, a[0]);
	}
};

struct UserDb {
	using Ent = macent_t;
	static constexpr const char *kCommand = "user";
	static constexpr const char *kWhat = "user";
	static constexpr const char *kDatabase = "user label database";
	static constexpr const char *kAddUsage = "add NAME LEV1 CAT1 LEV2 CAT2";
	static constexpr size_t kAddArgs = 5;

	static void *open() { return openmacdb_r(); }
	static int close(void *db) { return closemacdb_r(db); }
	static int rewind(void *db) { return setmacent_r(db); }
	static int end(void *db) { return endmacent_r(db); }
	static Ent *next(void *db) { return getmacent_r(db); }
	static void release(Ent *e) { freemacent_r(e); }
	static Ent *by_name(void *db, const std::string &k) { return getmacnam_r(db, k.c_str()); }
	static int rm_name(void *db, const std::string &k) { return rmmacnam_r(db, k.c_str()); }

	// Users are also found by uid; they are removed by name only.
	static std::optional<uint64_t> value_of(const std::string &k) { return parse_decimal(k, UINT32_MAX); }
	static Ent *by_value(void *db, uint64_t v) { return getmacuid_r(db, static_cast<uint32_t>(v)); }
	static int rm_value(void *, uint64_t) { errno = ENOENT; return -1; }

	static void text(const Ent *e, bool numeric)
	{
		std::printf("%s\t%s:%s\t%s:%s\n", e->name ? e->name : "",
		            level_text(e->lev1, numeric).c_str(), category_text(e->cat1, numeric).c_str(),
		            level_text(e->lev2, numeric).c_str(), category_text(e->cat2, numeric).c_str());
	}
	static void json(JsonWriter &j, const Ent *e)
	{
		j.begin_object();
		j.key("name");
		if (e->name)
			j.string(e->name);
		else
			j.null();
		j.key("lev1").number(e->lev1);
		j.key("lev1_text").string(level_text(e->lev1, false));
		j.key("cat1").string(hex_text(e->cat1));
		j.key("cat1_text").string(category_text(e->cat1, false));
		j.key("lev2").number(e->lev2);
		j.key("lev2_text").string(level_text(e->lev2, false));
		j.key("cat2").string(hex_text(e->cat2));
		j.key("cat2_text").string(category_text(e->cat2, false));
		j.end_object();
	}

	// NAME LEV1 CAT1 LEV2 CAT2, levels and categories by name or number.
	static int add(void *db, const std::vector<std::string> &a)
	{
		Refusal why;
		const auto lev1 = resolve_level(a[1], &why);
		const auto cat1 = lev1 ? resolve_categories(a[2], &why) : std::nullopt;
		const auto lev2 = cat1 ? resolve_level(a[3], &why) : std::nullopt;
		const auto cat2 = lev2 ? resolve_categories(a[4], &why) : std::nullopt;
		if (!cat2) {
			if (why.exit == kUsage)
				return usage_error(kCommand, why.reason);
			report(std::string(kWhat) + " '" + a[0] + "'", why.reason);
			return kFailure;
		}
		macent_t ent{const_cast<char *>(a[0].c_str()), *lev1, *cat1, *lev2, *cat2};
		return put_status(putmacent_r(db, &ent), kWhat, a[0]);
	}
};

// Closes the handle on every path out of a command.
template <class Db>
class Handle {
public:
	Handle() : db_(Db::open()) {}
	~Handle()
	{
		if (db_ != nullptr)
			Db::close(db_);
	}
	Handle(const Handle &) = delete;
	Handle &operator=(const Handle &) = delete;
	void *get() const { return db_; }

private:
	void *db_;
};

template <class Db>
struct EntPtr {
	typename Db::Ent *e;
	explicit EntPtr(typename Db::Ent *p) : e(p) {}
	~EntPtr()
	{
		if (e != nullptr)
			Db::release(e);
	}
	EntPtr(const EntPtr &) = delete;
	EntPtr &operator=(const EntPtr &) = delete;
};

template <class Db>
int report_lookup_failure(const std::string &key, int err)
{
	if (err == ENOENT || err == ENODATA || err == 0)
		report(std::string(Db::kWhat) + " '" + key + "'", "no such entry");
	else
		report_errno(Db::kDatabase, err);
	return kFailure;
}

template <class Db>
int db_list(void *db, const Args &args)
{
	if (args.positional.size() != 1)
		return usage_error(Db::kCommand, "list takes no arguments");
	if (Db::rewind(db) != 0) {
		report_errno(Db::kDatabase, errno);
		return kFailure;
	}
	JsonWriter j;
	j.begin_array();
	while (true) {
		EntPtr<Db> e(Db::next(db));
		if (e.e == nullptr)
			break;
		if (args.json)
			Db::json(j, e.e);
		else
			Db::text(e.e, args.has("numeric"));
	}
	Db::end(db);
	j.end_array();
	if (args.json)
		j.print();
	return kOk;
}

// By name first, then by value when the key reads as one; a name wins, as
// it does in label text.
template <class Db>
int db_get(void *db, const Args &args)
{
	if (args.positional.size() != 2)
		return usage_error(Db::kCommand, "get takes one NAME or VALUE");
	const std::string &key = args.positional[1];
	errno = 0;
	EntPtr<Db> e(Db::by_name(db, key));
	if (e.e == nullptr)
		if (const auto v = Db::value_of(key)) {
			errno = 0;
			e.e = Db::by_value(db, *v);
		}
	if (e.e == nullptr)
		return report_lookup_failure<Db>(key, errno);
	if (args.json) {
		JsonWriter j;
		Db::json(j, e.e);
		j.print();
	} else {
		Db::text(e.e, args.has("numeric"));
	}
	return kOk;
}

template <class Db>
int db_add(void *db, const Args &args)
{
	if (args.positional.size() != Db::kAddArgs + 1)
		return usage_error(Db::kCommand, std::string("usage: ") + Db::kCommand + " " + Db::kAddUsage);
	errno = 0;
	return Db::add(db, {args.positional.begin() + 1, args.positional.end()});
}

template <class Db>
int db_rm(void *db, const Args &args)
{
	if (args.positional.size() != 2)
		return usage_error(Db::kCommand, "rm takes one NAME or VALUE");
	const std::string &key = args.positional[1];
	errno = 0;
	int rc = Db::rm_name(db, key);
	if (rc != 0 && errno == ENOENT)
		if (const auto v = Db::value_of(key)) {
			errno = 0;
			rc = Db::rm_value(db, *v);
		}
	if (rc != 0)
		return report_lookup_failure<Db>(key, errno);
	return kOk;
}

template <class Db>
int db_command(int argc, char **argv)
{
	Args args;
	int status;
	if (!parse_command(argc, argv, {{'n', "numeric", false}}, false, &args, &status))
		return status;
	if (args.positional.empty())
		return usage_error(Db::kCommand, "missing action: list, get, add or rm");
	const std::string &verb = args.positional[0];
	int (*action)(void *, const Args &) = nullptr;
	if (verb == "list")
		action = db_list<Db>;
	else if (verb == "get")
		action = db_get<Db>;
	else if (verb == "add")
		action = db_add<Db>;
	else if (verb == "rm")
		action = db_rm<Db>;
	else
		return usage_error(Db::kCommand, "unknown action '" + verb + "'");

	errno = 0;
	Handle<Db> db;
	if (db.get() == nullptr) {
		report_errno(Db::kDatabase, errno);
		return kFailure;
	}
	return action(db.get(), args);
}

} // namespace

int cmd_lev(int argc, char **argv) { return db_command<LevDb>(argc, argv); }
int cmd_cat(int argc, char **argv) { return db_command<CatDb>(argc, argv); }
int cmd_user(int argc, char **argv) { return db_command<UserDb>(argc, argv); }

} // namespace vyr::tool
