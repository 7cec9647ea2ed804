// SPDX-License-Identifier: BSD-2-Clause
//
// Handlers take every exception, not only the numbers of failed calls. This
// program's own functions stand in for those that read the links.
#include <new>

#include "driver/dataset_links.h"
#include "driver/startup.h"
#include "tests/device/device.h"

using namespace device;

std::string latest_update_path() { return {}; }
std::string current_dataset_path() { throw std::bad_alloc(); }

namespace {

class OtherExceptions : public DeviceTest {};

TEST_F(OtherExceptions, FromTheCurrentLinksResetThemAndTheBootGoesOn) {
  install_system("2023c", "44l");
  point_links_at_update("2024a.1.0");
  EXPECT_THAT(printed_by(run_startup_pass),
              lines(warning("Invalid current symlinks; resetting to system "
                            "partition")));
  EXPECT_EQ(link_at(zoneinfo), system_tree);
}

}  // namespace
