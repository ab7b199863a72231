// Wizard pages without a package: the default answers of a wizard, and the reading of a
// wizard file.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "corv/log.h"
#include "corvpkg/json_util.h"
#include "corvpkg/pkgwizard.h"
#include "support/files.h"
#include "support/temp_dir.h"

using namespace CORVPackageTool;

namespace {

Json::Value json(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(fromString(text, value)) << text;
    return value;
}

class LogLines {
  public:
    LogLines() {
        CORVLogSetSink([this](int, const std::string& line) { lines_.push_back(line); });
    }
    ~LogLines() { CORVLogSetSink(nullptr); }
    bool has(const std::string& text) const {
        for (const std::string& line : lines_) {
            if (line.find(text) != std::string::npos) {
                return true;
            }
        }
        return false;
    }
    bool endsWith(const std::string& text) const {
        for (const std::string& line : lines_) {
            if (line.size() >= text.size() &&
                line.compare(line.size() - text.size(), text.size(), text) == 0) {
                return true;
            }
        }
        return false;
    }
    bool empty() const { return lines_.empty(); }

  private:
    std::vector<std::string> lines_;
};

}  // namespace

TEST(WizardDefaults, FindsEveryKeyWithADefault) {
    const struct {
        const char* ui;
        const char* values;
    } cases[] = {
        // The number becomes its text.
        {R"([{"items": [{"key": "a", "defaultValue": 1}]}])", R"({"a": "1"})"},
        {R"([{"items": [{"key": "s", "defaultValue": "text"}, {"key": "b", "defaultValue": true},
                        {"key": "r", "defaultValue": 1.5}, {"key": "n", "defaultValue": null}]}])",
         R"({"s": "text", "b": "true", "r": "1.5", "n": ""})"},
        // Questions nest anywhere, in arrays and objects alike.
        {R"([{"step_title": "t", "items": [{"type": "combobox",
              "subitems": [{"key": "deep", "defaultValue": "x"}]}],
              "layout": {"extra": {"key": "inobject", "defaultValue": 7}}}])",
         R"({"deep": "x", "inobject": "7"})"},
        // Only objects with both members count.
        {R"([{"items": [{"key": "nodefault"}, {"defaultValue": "nokey"}, {"desc": "text"}]}])",
         "{}"},
        // A later key overwrites an earlier one, across steps.
        {R"([{"items": [{"key": "k", "defaultValue": "first"}]},
             {"items": [{"key": "k", "defaultValue": "second"}]}])",
         R"({"k": "second"})"},
        // A default that is itself JSON is kept as its text, and is walked too.
        {R"([{"items": [{"key": "list", "defaultValue": [{"key": "inner", "defaultValue": 2}]}]}])",
         R"({"list": "[{\"defaultValue\":2,\"key\":\"inner\"}]", "inner": "2"})"},
        {"[]", "{}"},
        {"null", "{}"},
        {"5", "{}"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.ui);
        Json::Value values(Json::objectValue);
        getUIDefaultValues(json(c.ui), values);
        EXPECT_EQ(values, json(c.values)) << toString(values);
    }
}

TEST(WizardDefaults, AddsToWhatTheCallerHas) {
    Json::Value values = json(R"({"kept": "1", "a": "old"})");
    getUIDefaultValues(json(R"([{"items": [{"key": "a", "defaultValue": "new"}]}])"), values);
    EXPECT_EQ(values, json(R"({"kept": "1", "a": "new"})"));

    Json::Value fromNull;
    getUIDefaultValues(json(R"([{"items": [{"key": "a", "defaultValue": 0}]}])"), fromNull);
    EXPECT_EQ(fromNull, json(R"({"a": "0"})"));

    // Something that cannot take members is left alone, not a crash.
    Json::Value list(Json::arrayValue);
    getUIDefaultValues(json(R"([{"items": [{"key": "a", "defaultValue": 0}]}])"), list);
    EXPECT_EQ(list, Json::Value(Json::arrayValue));
}

TEST(WizardFile, ReadsAnArrayOfSteps) {
    enum Logged { kNothing, kNoJson, kNoArray, kNoItems };
    const struct {
        const char* content;
        bool ok;
        const char* wizard;  // what `wizard` holds afterwards
        Logged logged;
    } cases[] = {
        {R"([{"step_title": "one", "items": [{"key": "a"}]}, {"items": []}])", true,
         R"([{"step_title": "one", "items": [{"key": "a"}]}, {"items": []}])", kNothing},
        {"[]", true, "[]", kNothing},
        // No JSON: nothing of it is taken, not even the steps read before the error.
        {R"([{"items": []}, {"items": )", false, R"("before")", kNoJson},
        {"", false, R"("before")", kNoJson},
        // JSON but no array: kept as parsed.
        {R"({"items": []})", false, R"({"items": []})", kNoArray},
        // A step without an items array: what was parsed stays.
        {R"([{"items": []}, {"items": 1}])", false, R"([{"items": []}, {"items": 1}])", kNoItems},
        {R"([{"items": [1]}, {"title": "no items"}])", false,
         R"([{"items": [1]}, {"title": "no items"}])", kNoItems},
        {R"([3])", false, "[3]", kNoItems},
    };
    TempDir dir;
    const std::string path = dir.path() + "/install_uifile";
    for (const auto& c : cases) {
        SCOPED_TRACE(c.content);
        testutil::writeFile(path, c.content);
        LogLines log;
        Json::Value wizard("before");
        EXPECT_EQ(PMReadUIFileContent(path, wizard), c.ok);
        EXPECT_EQ(wizard, json(c.wizard)) << toString(wizard);
        switch (c.logged) {
            case kNothing:
                EXPECT_TRUE(log.empty());
                break;
            case kNoJson:
                EXPECT_TRUE(log.has(" " + path + ": "));
                break;
            case kNoArray:
                EXPECT_TRUE(log.endsWith(" Fail to parse " + path));
                break;
            case kNoItems:
                EXPECT_TRUE(log.endsWith(" Fail to parse " + path + " in [items]"));
                break;
        }
    }
}

TEST(WizardFile, MissingFileIsRefused) {
    TempDir dir;
    LogLines log;
    Json::Value wizard("before");
    EXPECT_FALSE(PMReadUIFileContent(dir.path() + "/absent", wizard));
    EXPECT_EQ(wizard, Json::Value("before"));
    EXPECT_TRUE(log.has("Fail to read " + dir.path() + "/absent"));
}
