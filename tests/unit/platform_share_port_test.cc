// The reference platform's share names and protocol files: what is accepted, and what is
// refused so that no name leads out of its volume and no malformed port list is published.
#include <gtest/gtest.h>

#include <string>

#include "corv/service_conf.h"
#include "corv/share.h"
#include "corv/vlibc.h"
#include "support/files.h"
#include "support/temp_dir.h"

TEST(PlatformShare, NamesThatCouldLeaveTheVolumeAreRefused) {
    const struct {
        const char* name;
        bool valid;
    } cases[] = {
        {"photos", true},   {"My Photos", true},    {"a_b-c.d+e@f", true}, {"", false},
        {".hidden", false}, {" lead", false},       {"@appstore", false},  {"../etc", false},
        {"a/b", false},     {"semi;colon", false},  {"tab\there", false},  {"new\nline", false},
        {"x\"y", false},    {"caf\xc3\xa9", false},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(CORVShareNameIsValid(c.name), c.valid) << "'" << c.name << "'";
    }
    EXPECT_FALSE(CORVShareNameIsValid(nullptr));
    EXPECT_TRUE(CORVShareNameIsValid(std::string(64, 'a').c_str()));
    EXPECT_FALSE(CORVShareNameIsValid(std::string(65, 'a').c_str()));
}

TEST(PlatformShare, UserNamesWithSeparatorsAreNoUsers) {
    char buffer[64];
    for (const char* name : {"", "a,b", "a:b", "a b", "../root", "ro\not"}) {
        EXPECT_EQ(VLIBUserRealNameGet(name, buffer, sizeof(buffer)), -1) << "'" << name << "'";
        EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_USER) << "'" << name << "'";
    }
    EXPECT_EQ(VLIBUserRealNameGet("root", buffer, sizeof(buffer)), 0);
    EXPECT_STREQ(buffer, "root");
    EXPECT_EQ(VLIBUserRealNameGet("root", buffer, 4), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_BUF_TOO_SMALL);
}

TEST(PlatformPortConf, ProtocolFilesParseIntoRangesOrAreRefusedWhole) {
    const struct {
        const char* text;
        const char* ranges;  // "service proto from-to;..." or null when refused
    } cases[] = {
        {"[web]\ndst.ports=\"8080/tcp\"\n", "web tcp 8080-8080;"},
        {"[a]\ndst.ports=\"1,10:20/tcp,udp\"\n[b]\ndst.ports=\"65535/udp\"\n",
         "a tcp 1-1;a udp 1-1;a tcp 10-20;a udp 10-20;b udp 65535-65535;"},
        {"", nullptr},
        {"dst.ports=\"80/tcp\"\n", nullptr},
        {"[web]\ntitle=\"no ports\"\n", nullptr},
        {"[web]\ndst.ports=\"0/tcp\"\n", nullptr},
        {"[web]\ndst.ports=\"65536/tcp\"\n", nullptr},
        {"[web]\ndst.ports=\"20:10/tcp\"\n", nullptr},
        {"[web]\ndst.ports=\"80\"\n", nullptr},
        {"[web]\ndst.ports=\"80/sctp\"\n", nullptr},
        {"[web]\ndst.ports=\"80,/tcp\"\n", nullptr},
        {"[web]\ndst.ports=\"-1/tcp\"\n", nullptr},
        {"[ok]\ndst.ports=\"80/tcp\"\n[bad]\ndst.ports=\"x/tcp\"\n", nullptr},
    };
    TempDir tmp;
    const std::string path = tmp.path() + "/p.sc";
    for (const auto& c : cases) {
        testutil::writeFile(path, c.text);
        PCORVSERVICECONFPORTS ports = nullptr;
        const int rc = CORVServiceConfParse(path.c_str(), &ports);
        if (c.ranges == nullptr) {
            EXPECT_EQ(rc, -1) << c.text;
            EXPECT_EQ(ports, nullptr) << c.text;
            continue;
        }
        ASSERT_EQ(rc, 0) << c.text;
        std::string got;
        for (const CORVSERVICECONFPORT& p : ports->ports) {
            got += p.service + " " + p.protocol + " " + std::to_string(p.from) + "-" +
                   std::to_string(p.to) + ";";
        }
        EXPECT_EQ(got, c.ranges) << c.text;
        CORVServiceConfPortsFree(ports);
    }
    PCORVSERVICECONFPORTS ports = nullptr;
    EXPECT_EQ(CORVServiceConfParse((tmp.path() + "/none.sc").c_str(), &ports), -1);
    EXPECT_EQ(VLIBCErrGet(), ERR_NO_SUCH_FILE);
}
