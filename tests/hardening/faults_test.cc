// Faults and damaged data, end to end through the library's own calls:
// - stored labels (file attributes and process records) that are damaged in
//   every way the stored form can be: an error, never a crash and never a
//   half-filled label or record;
// - a label changed by another process while it is being read: every read
//   gives the old or the new label whole, even as the needed room changes
//   between the service's E2BIG answer and the second offer;
// - a full file system under the files back-end: the write fails with
//   ENOSPC, the database file stays as it was, and no temporary is left.
#include <vyr/classic.h>
#include <vyr/kernel.h>
#include <vyr/label.h>
#include <vyr/namedb.h>
#include <vyr/raw.h>
#include <vyr/text.h>

#include "support/labels.hh"
#include "hardening/files_db.hh"
#include "support/scratch_dir.hh"

#include <dirent.h>
#include <sched.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <functional>
#include <string>
#include <vector>

namespace hardening {
namespace {

std::vector<std::string> names_in(const std::string &dir)
{
	std::vector<std::string> out;
	if (DIR *d = ::opendir(dir.c_str())) {
		while (const dirent *e = ::readdir(d))
			if (e->d_name[0] != '.')
				out.emplace_back(e->d_name);
		::closedir(d);
	}
	return out;
}

// ---- the stored form, built by hand ----

void put_le(std::vector<uint8_t> &b, uint64_t v, int bytes)
{
	for (int i = 0; i < bytes; ++i)
		b.push_back(static_cast<uint8_t>(v >> (8 * i)));
}

// A whole label in the stored form (the whole-label raw form): version 1,
// lev 5, ilev 1, cat 0x30, type 1, a blob of blob_size bytes, and the given
// role ids.
std::vector<uint8_t> stored_label(const std::vector<uint64_t> &roles1 = {9, 4},
                                  const std::vector<uint64_t> &roles2 = {7}, uint32_t blob_size = 3)
{
	std::vector<uint8_t> b;
	put_le(b, 1, 2);
	put_le(b, 1, 2);
	put_le(b, 5, 1);
	put_le(b, 1, 1);
	put_le(b, 0x30, 8);
	put_le(b, blob_size, 4);
	put_le(b, roles1.size(), 4);
	put_le(b, roles2.size(), 4);
	for (uint32_t i = 0; i < blob_size; ++i)
		b.push_back(static_cast<uint8_t>(0xaa + i));
	for (const auto *list : {&roles1, &roles2}) {
		for (uint64_t id : *list) {
			put_le(b, id, 8);
			put_le(b, 0, 4);
			put_le(b, 0, 1);
		}
	}
	return b;
}

vyrl_t *label_of(const std::vector<uint8_t> &form)
{
	return vyrl_get_from_raw(form.data(), form.size());
}

struct Damage {
	const char *what;
	std::function<void(std::vector<uint8_t> &)> spoil;
	int err;
};

const std::vector<Damage> &damages()
{
	static const std::vector<Damage> table = {
		{"one byte short", [](auto &b) { b.pop_back(); }, EIO},
		{"one byte too many", [](auto &b) { b.push_back(0); }, EIO},
		{"header only", [](auto &b) { b.resize(26); }, EIO},
		{"cut inside the header", [](auto &b) { b.resize(10); }, EIO},
		{"version 2", [](auto &b) { b[0] = 2; }, EINVAL},
		{"roles out of order", [](auto &b) { b[29] = 3; /* first id 9 -> 3 */ }, EIO},
		{"duplicate role ids", [](auto &b) { b[29 + 13] = 9; /* second id 4 -> 9 */ }, EIO},
		{"blob size 4 GiB - 1", [](auto &b) { std::memset(&b[14], 0xff, 4); }, EIO},
		{"role count 4 G - 1", [](auto &b) { std::memset(&b[18], 0xff, 4); }, EIO},
		{"both counts huge", [](auto &b) { std::memset(&b[18], 0xff, 8); }, EIO},
	};
	return table;
}

class DamagedStore : public ::testing::Test {
protected:
	// One directory for the suite: the channel reads the state directory
	// when it first opens, and stays open.
	static void SetUpTestSuite()
	{
		scratch_ = new vyr_test::ScratchDir();
		ASSERT_TRUE(scratch_->ok());
		dir_ = &scratch_->path();
		::setenv("VYR_TAVREL_XATTR_NS", "user", 1);
		::setenv("VYR_TAVREL_STATE_DIR", (*scratch_ / "state").c_str(), 1);
	}
	static void TearDownTestSuite()
	{
		delete scratch_;
		scratch_ = nullptr;
	}
	static vyr_test::ScratchDir *scratch_;
	static const std::string *dir_;
};
vyr_test::ScratchDir *DamagedStore::scratch_ = nullptr;
const std::string *DamagedStore::dir_ = nullptr;

TEST_F(DamagedStore, FileAttributeIsAnErrorAndNothingIsFilled)
{
	const std::string f = *dir_ + "/file";
	install_file(f, "");
	const std::vector<uint8_t> good = stored_label();
	if (::setxattr(f.c_str(), "user.vyrlabel", good.data(), good.size(), 0) != 0)
		GTEST_SKIP() << *dir_ << " keeps no user.* attributes";
	vyrl_t *l = vyr_get_path(f.c_str());
	ASSERT_NE(l, nullptr) << "the undamaged form must read";
	EXPECT_EQ(l->ml->blob_size, 3u);
	vyrl_put(l);

	for (const Damage &d : damages()) {
		SCOPED_TRACE(d.what);
		std::vector<uint8_t> bad = good;
		d.spoil(bad);
		ASSERT_EQ(::setxattr(f.c_str(), "user.vyrlabel", bad.data(), bad.size(), 0), 0);
		errno = 0;
		EXPECT_EQ(vyr_get_path(f.c_str()), nullptr);
		EXPECT_EQ(errno, d.err);
		EXPECT_EQ(mac_get_file(f.c_str()), nullptr);
		tavrel_mac_label_t sentinel{0x5a, {0x77, 0x1234}};
		EXPECT_EQ(tavrel_statmac(f.c_str(), &sentinel), -1);
		EXPECT_TRUE(sentinel.type_low == 0x5a && sentinel.mac.lev == 0x77 && sentinel.mac.cat == 0x1234);
	}
}

TEST_F(DamagedStore, ProcessRecordIsAnErrorAndNothingIsFilled)
{
	vyrl_t *mine = label_of(stored_label({5}, {}, 0));
	ASSERT_NE(mine, nullptr);
	ASSERT_EQ(vyr_set_pid(0, mine), 0);
	vyrl_put(mine);
	const std::string state = *dir_ + "/state";
	const std::vector<std::string> records = names_in(state);
	ASSERT_EQ(records.size(), 1u);
	const std::string record = state + "/" + records[0];

	for (const Damage &d : damages()) {
		SCOPED_TRACE(d.what);
		std::vector<uint8_t> bad = stored_label();
		d.spoil(bad);
		install_file(record, std::string(bad.begin(), bad.end()));
		errno = 0;
		EXPECT_EQ(vyr_get_pid(0), nullptr);
		EXPECT_EQ(errno, d.err);
		EXPECT_EQ(mac_get_pid(0), nullptr);
		tavrel_mac_t sentinel{0x77, 0x1234};
		EXPECT_EQ(tavrel_getmac(0, &sentinel), -1);
		EXPECT_TRUE(sentinel.lev == 0x77 && sentinel.cat == 0x1234);
	}
}

// ---- a label changing under its readers ----


TEST_F(DamagedStore, LabelChangedWhileReadIsReadWhole)
{
	const std::string f = *dir_ + "/changing";
	install_file(f, "");
	// Two labels of different shapes: the second needs more room in all
	// three dimensions, so a reader offered the room of one may meet the
	// other on its second pass.
	std::vector<uint64_t> many;
	for (uint64_t id = 200; id > 0; --id) // 2.6 KiB stored: within one ext4 block
		many.push_back(id);
	vyrl_t *small = label_of(stored_label({3}, {}, 0));
	vyrl_t *big = label_of(stored_label(many, {60, 50, 40}, 100));
	ASSERT_TRUE(small && big);
	if (vyr_set_path(f.c_str(), small) != 0)
		GTEST_SKIP() << *dir_ << " keeps no user.* attributes: " << std::strerror(errno);
	ASSERT_EQ(vyr_set_path(f.c_str(), big), 0) << std::strerror(errno);
	ASSERT_EQ(vyr_set_path(f.c_str(), small), 0);
	const std::string small_raw = vyr_test::raw_bytes(small), big_raw = vyr_test::raw_bytes(big);

	const pid_t writer = ::fork();
	ASSERT_GE(writer, 0);
	if (writer == 0) {
		for (int i = 0; i < 200000; ++i)
			if (vyr_set_path(f.c_str(), i % 2 ? big : small) != 0)
				::_exit(1);
		::_exit(0);
	}
	// Until both labels were seen often, or for at most ten seconds.
	int other = 0, seen_small = 0, seen_big = 0;
	const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(10);
	while ((seen_small < 200 || seen_big < 200) && std::chrono::steady_clock::now() < until) {
		vyrl_t *got = vyr_get_path(f.c_str());
		ASSERT_NE(got, nullptr) << std::strerror(errno);
		const std::string raw = vyr_test::raw_bytes(got);
		seen_small += raw == small_raw;
		seen_big += raw == big_raw;
		other += raw != small_raw && raw != big_raw;
		vyrl_put(got);
	}
	::kill(writer, SIGKILL);
	::waitpid(writer, nullptr, 0);
	vyrl_put(small);
	vyrl_put(big);
	EXPECT_EQ(other, 0);
	EXPECT_GT(seen_small, 0);
	EXPECT_GT(seen_big, 0);
}

// ---- a full file system under the files back-end ----

// Runs in a child with a mount namespace of its own: a 64 KiB tmpfs holds
// the database, a filler file takes the rest of it, and a level is added.
// Exit codes: 0 as expected, 100 no mount possible here, others see below.
int full_disk_child(const std::string &dir)
{
	if (::unshare(CLONE_NEWNS) != 0 || ::mount("none", "/", "none", MS_REC | MS_PRIVATE, nullptr) != 0 ||
	    ::mount("tmpfs", dir.c_str(), "tmpfs", 0, "size=64k") != 0)
		return 100;
	std::string levels;
	for (int i = 0; i < 150; ++i)
		levels += "level" + std::to_string(i) + ":" + std::to_string(i) + "\n";
	install_file(dir + "/levels", levels);
	install_file(dir + "/dbroute.conf", "lev_backend = files\nlev_charset = UTF-8\nfiles_dir = " + dir + "\n");
	::setenv("VYR_DBROUTE_CONF", (dir + "/dbroute.conf").c_str(), 1);

	void *db = openlevdb_r();
	if (db == nullptr)
		return 101;
	// Fill the file system to the last block.
	FILE *filler = std::fopen((dir + "/filler").c_str(), "w");
	if (filler == nullptr)
		return 102;
	std::setvbuf(filler, nullptr, _IONBF, 0);
	const std::string chunk(512, 'x');
	while (std::fwrite(chunk.data(), 1, chunk.size(), filler) == chunk.size()) {
	}
	std::fclose(filler);

	const levent_t e{const_cast<char *>("added"), 200};
	errno = 0;
	const int rc = putlevent_r(db, &e);
	const int err = errno;
	if (rc != -1)
		return 103;
	if (err != ENOSPC)
		return 104;
	if (read_file(dir + "/levels") != levels)
		return 105;
	for (const std::string &name : names_in(dir))
		if (name.find(".tmp") != std::string::npos)
			return 106;
	// With room again the same write goes through.
	std::remove((dir + "/filler").c_str());
	if (putlevent_r(db, &e) != 0 || read_file(dir + "/levels") != levels + "added:200\n")
		return 107;
	closelevdb_r(db);
	return 0;
}

TEST(FullDisk, FailedWriteKeepsTheDatabaseFile)
{
	// The mount point; the tmpfs on it goes with the child's namespace.
	vyr_test::ScratchDir mount_point;
	ASSERT_TRUE(mount_point.ok());
	const pid_t pid = ::fork();
	ASSERT_GE(pid, 0);
	if (pid == 0)
		::_exit(full_disk_child(mount_point.path()));
	int status = 0;
	ASSERT_EQ(::waitpid(pid, &status, 0), pid);
	ASSERT_TRUE(WIFEXITED(status));
	if (WEXITSTATUS(status) == 100)
		GTEST_SKIP() << "no private tmpfs mount possible here (needs root)";
	// 103: the write claimed success; 104: another errno; 105: the file
	// changed; 106: a temporary was left; 107: the retry with room failed.
	EXPECT_EQ(WEXITSTATUS(status), 0);
}

} // namespace
} // namespace hardening
