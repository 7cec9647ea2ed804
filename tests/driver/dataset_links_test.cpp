// SPDX-License-Identifier: BSD-2-Clause
#include "driver/dataset_links.h"

#include <cerrno>

#include "tests/device/device.h"

using namespace device;

namespace {

class DatasetPathFromLink : public DeviceTest {
 protected:
  static void accepts(const std::string& target, const std::string& path) {
    EXPECT_EQ(quietly([&] { return dataset_path_from_link(target); }), path)
        << target;
  }
  static void rejects(const std::string& target) {
    const auto reject = [&] {
      errno = EXDEV;
      dataset_path_from_link(target);
    };
    throws(-1, reject, bad_zoneinfo_link(target, EXDEV));
  }
};

TEST_F(DatasetPathFromLink, IsAllBeforeTheLastSlashOfADownloadAsItStands) {
  for (const std::string name : {"2024a.1.0", "x", "a/", "/a", "../x"})
    accepts(update(name) + "/zoneinfo", update(name));
  accepts("/usr/share/zoneinfo.default", "");
}

TEST_F(DatasetPathFromLink, AcceptsAnyNameAfterTheLastSlash) {
  accepts("/var/db/timezone/tz/x/", "/var/db/timezone/tz/x");
  accepts("/var/db/timezone/tz/2024a.1.0/icutz",
          "/var/db/timezone/tz/2024a.1.0");
  accepts("/var/db/timezone/tz/2024a.1.0/zoneinfo/",
          "/var/db/timezone/tz/2024a.1.0/zoneinfo");
}

TEST_F(DatasetPathFromLink, AcceptsATargetSeveralLevelsDown) {
  accepts("/var/db/timezone/tz/a/b/zoneinfo", "/var/db/timezone/tz/a/b");
}

TEST_F(DatasetPathFromLink, RejectsWhatNamesNoDataSetAndNotExactlyTheSystems) {
  for (const char* target :
       {// Nothing, or nothing but a "/", between the prefix and the last "/".
        "/var/db/timezone/tz/2024a.1.0", "/var/db/timezone/tz/x",
        "/var/db/timezone/tz/", "/var/db/timezone/tz",
        "/var/db/timezone/tz//zoneinfo", "/var/db/timezone/tz//",
        // Another spelling of the system tree.
        "/usr/share/zoneinfo.default/", "/usr/share/zoneinfo.defaulT",
        "/usr/share/zoneinfo.default2", "/usr/share/zoneinfo",
        "../../../usr/share/zoneinfo.default", "//usr/share/zoneinfo.default",
        "usr/share/zoneinfo.default", "/usr/share//zoneinfo.default",
        // Anywhere else.
        "", "/", "tz/2024a.1.0/zoneinfo", "/var/db/Timezone/tz/a/zoneinfo",
        "/var/db/timezone/tZ/a/zoneinfo", "/var/db/timezone/tz2/a/zoneinfo",
        " /var/db/timezone/tz/a/zoneinfo", "%s%n", "two\twords"})
    rejects(target);
}

}  // namespace
