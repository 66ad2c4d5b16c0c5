// SPDX-License-Identifier: Apache-2.0
#include "timezone.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>

namespace {

struct Scene {
    const char *variable; ///< TZ; null: not set
    const char *target;   ///< of the link; null: no link; "": a file in its place
    const char *name;     ///< what the name file holds; null: no file
    const char *zone;
};

const Scene kScenes[] = {
    {nullptr, "/usr/share/zoneinfo/Europe/Zurich", "Asia/Tokyo\n", "Europe/Zurich"},
    {nullptr, "../usr/share/zoneinfo/Etc/GMT+5", nullptr, "Etc/GMT+5"},
    {"Asia/Tokyo", "/usr/share/zoneinfo/Europe/Zurich", nullptr, "Asia/Tokyo"},
    {":/usr/share/zoneinfo/Asia/Tokyo", nullptr, nullptr, "Asia/Tokyo"},
    {"", "/usr/share/zoneinfo/UTC", nullptr, "UTC"},
    {nullptr, "", "Asia/Tokyo\n", "Asia/Tokyo"},
    {nullptr, "", nullptr, ""},
    {nullptr, "", "no name\n", ""},
    {nullptr, nullptr, nullptr, "Etc/UTC"}};

TEST(Timezone, IsFoundWhereTheMachineSaysIt) {
    for (const Scene &scene : kScenes) {
        SCOPED_TRACE(scene.zone);
        std::string folder = "/tmp/ovrat.XXXXXX";
        ASSERT_NE(mkdtemp(folder.data()), nullptr);
        const Ovradrd::TimezoneFiles files{folder + "/link", folder + "/name"};
        unsetenv("TZ");
        if (scene.variable != nullptr) {
            setenv("TZ", scene.variable, 1);
        }
        if (scene.target != nullptr && *scene.target == '\0') {
            std::ofstream(files.link) << "TZif2";
        } else if (scene.target != nullptr) {
            std::filesystem::create_symlink(scene.target, files.link);
        }
        if (scene.name != nullptr) {
            std::ofstream(files.name) << scene.name;
        }
        EXPECT_EQ(Ovradrd::localTimezone(files), scene.zone);
        std::filesystem::remove_all(folder);
    }
}

} // namespace
