// Which package scripts are run at all.
#include <sys/stat.h>

#include <gtest/gtest.h>

#include <string>

#include "corvpkg/pkgfile.h"
#include "corvpkg/pkgvolume.h"
#include "support/files.h"
#include "support/temp_dir.h"

using namespace CORVPackageTool;

TEST(ScriptCheck, OnlyNonEmptyOwnerExecutableFilesRun) {
    TempDir dir;
    const struct {
        const char* name;
        const char* content;  // null: no file
        mode_t mode;
        bool runs;
    } cases[] = {
        {"ok", "#!/bin/sh\n", 0755, true},
        {"owner-only", "#!/bin/sh\n", 0700, true},
        {"group-only", "#!/bin/sh\n", 0650, false},
        {"empty", "", 0755, false},
        {"missing", nullptr, 0, false},
    };
    for (const auto& c : cases) {
        const std::string path = dir.path() + "/" + c.name;
        if (c.content != nullptr) {
            testutil::writeFile(path, c.content);
            chmod(path.c_str(), c.mode);
        }
        EXPECT_EQ(PMSCheckIsExec(path), c.runs) << c.name;
    }
}

TEST(ScriptCheck, ScriptMaskCountsAndRepairsScripts) {
    TempDir dir;
    testutil::writeFile(dir.path() + "/start-stop-status", "#!/bin/sh\n");
    testutil::writeFile(dir.path() + "/postupgrade", "#!/bin/sh\n");
    testutil::writeFile(dir.path() + "/unrelated", "#!/bin/sh\n");
    chmod((dir.path() + "/postupgrade").c_str(), 0644);
    EXPECT_EQ(PMGetScriptMask(dir.path()), 0x01u | 0x40u);
    EXPECT_TRUE(PMSCheckIsExec(dir.path() + "/postupgrade"));
    EXPECT_EQ(PMGetScriptMask(dir.path() + "/none"), 0u);
}
