// Faults end to end: damaged stored labels, a label changed while read, and
// a full file system under the files back-end.
#include <vyr/classic.h>
#include <vyr/kernel.h>
#include <vyr/label.h>
#include <vyr/namedb.h>

#include "hardening/files_db.hh"
#include "support/labels.hh"

#include <sched.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <filesystem>
#include <map>
#include <numeric>
#include <string>
#include <vector>

namespace hardening {
namespace {

namespace fs = std::filesystem;
using vyr_test::Label;

// A label of level lev with the given role ids and a blob of blob_size bytes.
Label label(uint8_t lev, const std::vector<uint64_t> &ids1, const std::vector<uint64_t> &ids2 = {},
            uint32_t blob_size = 0)
{
	std::vector<vyr_role_t> r[2];
	for (int i = 0; i < 2; ++i)
		for (uint64_t id : i ? ids2 : ids1)
			r[i].push_back({id, 0, 0});
	Label l(vyrl_get_new_init_mac_roles(lev, 1, 0x30, 1, r[0].data(), r[0].size(), r[1].data(), r[1].size()));
	if (l && blob_size > 0)
		l->ml->blob = static_cast<unsigned char *>(std::calloc(l->ml->blob_size = blob_size, 1));
	return l;
}

class Faults : public ::testing::Test {
protected:
	void SetUp() override
	{
		ASSERT_TRUE(dir_.ok());
		::setenv("VYR_TAVREL_XATTR_NS", "user", 1);
		::setenv("VYR_TAVREL_STATE_DIR", (dir_ / "state").c_str(), 1);
	}
	vyr_test::ScratchDir dir_;
};

// Stored labels are whole-label byte forms: a 26-byte header (counts at 14, 18,
// 22), then 13 bytes a role. Damage is an error, never a half-filled label.
TEST_F(Faults, DamagedStoredLabelIsAnErrorAndNothingIsFilled)
{
	const std::string f = dir_ / "file";
	install_file(f, "");
	const Label mine = label(5, {9, 4}, {7});
	ASSERT_TRUE(mine);
	if (vyr_set_path(f.c_str(), mine.get()) != 0)
		GTEST_SKIP() << dir_.path() << " keeps no user.* attributes";
	ASSERT_EQ(vyr_set_pid(0, mine.get()), 0);
	const std::string record = fs::directory_iterator(dir_ / "state")->path(), good = vyr_test::raw_bytes(mine.get());
	ASSERT_EQ(good.size(), 26u + 3 * 13);

	const struct {
		const char *what;
		std::string bytes;
		int err;
	} cases[] = {
		{"one byte short", good.substr(0, good.size() - 1), EIO},
		{"one byte too many", good + '\0', EIO},
		{"cut inside the header", good.substr(0, 10), EIO},
		{"version 2", '\2' + good.substr(1), EINVAL},
		{"roles out of order", good.substr(0, 26) + '\3' + good.substr(27), EIO},
		{"role count 4 G - 1", good.substr(0, 18) + "\xff\xff\xff\xff" + good.substr(22), EIO},
	};
	for (const auto &c : cases) {
		SCOPED_TRACE(c.what);
		ASSERT_EQ(::setxattr(f.c_str(), "user.vyrlabel", c.bytes.data(), c.bytes.size(), 0), 0);
		install_file(record, c.bytes);
		for (const bool file : {true, false}) {
			errno = 0;
			EXPECT_EQ(file ? vyr_get_path(f.c_str()) : vyr_get_pid(0), nullptr);
			EXPECT_EQ(errno, c.err);
			EXPECT_EQ(file ? mac_get_file(f.c_str()) : mac_get_pid(0), nullptr);
		}
		tavrel_mac_label_t sentinel{0x5a, {0x77, 0x1234}};
		EXPECT_TRUE(tavrel_statmac(f.c_str(), &sentinel) == -1 && tavrel_getmac(0, &sentinel.mac) == -1);
		EXPECT_TRUE(sentinel.type_low == 0x5a && sentinel.mac.lev == 0x77 && sentinel.mac.cat == 0x1234);
	}
}

// A writer flips the label between a small and a larger shape, so that a
// reader's second offer after E2BIG may meet the other: each read is whole.
TEST_F(Faults, LabelChangedWhileReadIsReadWhole)
{
	const std::string f = dir_ / "changing";
	install_file(f, "");
	std::vector<uint64_t> many(200); // about 2.6 KiB stored: within one file system block
	std::iota(many.begin(), many.end(), 1);
	const Label small = label(3, {3}), big = label(5, many, {60, 50, 40}, 100);
	ASSERT_TRUE(small && big);
	if (vyr_set_path(f.c_str(), big.get()) != 0)
		GTEST_SKIP() << dir_.path() << " keeps no user.* attributes: " << std::strerror(errno);
	const std::string small_raw = vyr_test::raw_bytes(small.get()), big_raw = vyr_test::raw_bytes(big.get());

	const pid_t writer = ::fork();
	ASSERT_GE(writer, 0);
	if (writer == 0) {
		for (int i = 0; i < 200000; ++i)
			if (vyr_set_path(f.c_str(), i % 2 ? big.get() : small.get()) != 0)
				::_exit(1);
		::_exit(0);
	}
	std::map<std::string, int> seen; // times each form was read
	const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(10);
	while ((seen[small_raw] < 200 || seen[big_raw] < 200) && std::chrono::steady_clock::now() < until) {
		const Label got(vyr_get_path(f.c_str()));
		ASSERT_TRUE(got) << std::strerror(errno);
		++seen[vyr_test::raw_bytes(got.get())];
	}
	::kill(writer, SIGKILL);
	::waitpid(writer, nullptr, 0);
	EXPECT_EQ(seen.size(), 2u) << "a label was read part old, part new";
	EXPECT_TRUE(seen[small_raw] > 0 && seen[big_raw] > 0);
}

// In a private mount namespace a filled 64 KiB tmpfs holds the database.
// Exit codes: 100 no mount possible, 101 setup, 102 no ENOSPC, 103 the file
// changed or a temporary was left, 104 no success once there is room.
int full_disk_child(const std::string &dir)
{
	if (::unshare(CLONE_NEWNS) != 0 || ::mount("none", "/", "none", MS_REC | MS_PRIVATE, nullptr) != 0 ||
	    ::mount("tmpfs", dir.c_str(), "tmpfs", 0, "size=64k") != 0)
		return 100;
	std::string levels;
	for (int i = 0; i < 150; ++i)
		levels += "level" + std::to_string(i) + ":" + std::to_string(i) + "\n";
	install_file(dir + "/levels", levels);
	install_file(dir + "/dbroute.conf", "lev_backend = files\nfiles_dir = " + dir + "\n");
	::setenv("VYR_DBROUTE_CONF", (dir + "/dbroute.conf").c_str(), 1);
	void *db = openlevdb_r();
	if (db == nullptr)
		return 101;
	for (std::ofstream filler(dir + "/filler"); filler << std::string(512, 'x') << std::flush;) {
	}
	const levent_t e{const_cast<char *>("added"), 200};
	errno = 0;
	if (putlevent_r(db, &e) != -1 || errno != ENOSPC)
		return 102;
	for (const auto &f : fs::directory_iterator(dir))
		if (f.path().filename().string().find(".tmp") != std::string::npos || read_file(dir + "/levels") != levels)
			return 103;
	std::remove((dir + "/filler").c_str());
	if (putlevent_r(db, &e) != 0 || read_file(dir + "/levels") != levels + "added:200\n")
		return 104;
	closelevdb_r(db);
	return 0;
}

TEST(FullDisk, FailedWriteKeepsTheDatabaseFile)
{
	vyr_test::ScratchDir mount_point; // the tmpfs goes with the child's namespace
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
	EXPECT_EQ(WEXITSTATUS(status), 0);
}

} // namespace
} // namespace hardening
