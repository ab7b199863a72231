// Variable substitution in request files: a table of documents, variables and results.
#include <gtest/gtest.h>

#include <string>

#include "corv/vlibc.h"
#include "corvpkg/json_util.h"
#include "corvpkg/resource.h"

using CORVPackageTool::fromString;
using CORVPackageTool::toString;
using CORVPackageTool::Util::ReplaceVariables;

namespace {

Json::Value parse(const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(fromString(text, value)) << text;
    return value;
}

struct Case {
    const char* what;
    const char* variables;
    const char* document;
    const char* expected;  // compact JSON
};

const Case kCases[] = {
    {"boolean placeholder becomes a boolean", R"({"x":true})", R"({"a":"{{x}}"})", R"({"a":true})"},
    {"false boolean", R"({"x":false})", R"({"a":"{{x}}"})", R"({"a":false})"},
    {"boolean inside a text is dropped", R"({"x":true})", R"({"a":"a{{x}}","b":"keep"})",
     R"({"b":"keep"})"},
    {"text placeholder", R"({"x":"y"})", R"({"a":"{{x}}"})", R"({"a":"y"})"},
    {"two known placeholders join", R"({"a":"1","b":"2"})", R"({"p":"{{a}}/{{b}}"})",
     R"({"p":"1/2"})"},
    {"one unknown drops the joined text", R"({"a":"1"})", R"({"p":"{{a}}/{{b}}","q":1})",
     R"({"q":1})"},
    {"every occurrence is replaced", R"({"a":"z"})", R"({"p":"{{a}}-{{a}}-{{a}}"})",
     R"({"p":"z-z-z"})"},
    {"stray closing braces drop the member", R"({})", R"({"a":"x}}","b":"y"})", R"({"b":"y"})"},
    {"stray opening braces drop the member", R"({})", R"({"a":"{{x","b":"y"})", R"({"b":"y"})"},
    {"single braces are plain text", R"({})", R"({"a":"{x}"})", R"({"a":"{x}"})"},
    {"value with braces drops the node", R"({"a":"{{zz"})", R"({"p":"{{a}}"})", R"({})"},
    {"a later key matches what an earlier value inserted", R"({"a":"{{b}}","b":"B"})",
     R"({"p":"{{a}}"})", R"({"p":"B"})"},
    {"an earlier key does not match what a later value inserted", R"({"a":"A","b":"{{a}}"})",
     R"({"p":"{{b}}"})", R"({})"},
    {"inserted text is not rescanned by the same key", R"({"a":"{{a}}"})", R"({"p":"{{a}}"})",
     R"({})"},
    {"array elements shift", R"({})", R"({"l":["{{unknown}}","b"]})", R"({"l":["b"]})"},
    {"object emptied by pruning stays", R"({})", R"({"o":{"a":"{{u}}"}})", R"({"o":{}})"},
    {"author's nulls are removed", R"({})", R"({"a":null,"l":[null,1,null],"o":{"n":null}})",
     R"({"l":[1],"o":{}})"},
    {"nested arrays and objects", R"({"v":"V"})", R"({"l":[{"a":["{{v}}","{{w}}"]},[null]]})",
     R"({"l":[{"a":["V"]},[]]})"},
    {"numbers substitute by their text", R"({"n":8080,"r":1.5})", R"({"p":"{{n}}:{{r}}"})",
     R"({"p":"8080:1.5"})"},
    {"number placeholder stays a text", R"({"n":8080})", R"({"p":"{{n}}"})", R"({"p":"8080"})"},
    {"null, object and array variables are unknown", R"({"a":null,"b":{},"c":[]})",
     R"({"p":"{{a}}","q":"{{b}}","r":"{{c}}","s":"ok"})", R"({"s":"ok"})"},
    {"non-text nodes are untouched", R"({"x":"y"})", R"({"n":5,"b":false,"d":2.5})",
     R"({"b":false,"d":2.5,"n":5})"},
    {"keys are not substituted", R"({"x":"y"})", R"({"{{x}}":"v"})", R"({"{{x}}":"v"})"},
    {"bare text at the top is substituted", R"({"x":"y"})", R"("a{{x}}")", R"("ay")"},
    {"bare unresolved text at the top ends as null", R"({})", R"("{{x}}")", R"(null)"},
    {"bare array at the top is pruned", R"({})", R"(["{{x}}",1])", R"([1])"},
    {"boolean exact match wins over text rules", R"({"x":true})", R"(["{{x}}","{{x}}{{x}}"])",
     R"([true])"},
    {"a text variable named like a boolean stays text", R"({"x":"true"})", R"({"a":"{{x}}"})",
     R"({"a":"true"})"},
    {"empty variable name", R"({"":"E"})", R"({"a":"{{}}"})", R"({"a":"E"})"},
};

}  // namespace

TEST(ReplaceVariables, Table) {
    for (const Case& c : kCases) {
        Json::Value variables = parse(c.variables);
        Json::Value document = parse(c.document);
        ASSERT_TRUE(ReplaceVariables(variables, document)) << c.what;
        EXPECT_EQ(toString(document), toString(parse(c.expected)))
            << c.what << "\n  variables: " << c.variables << "\n  document:  " << c.document;
    }
}

TEST(ReplaceVariables, VariablesThatAreNoObjectAreRefusedAndLeaveTheDocument) {
    const char* kBad[] = {"null", "[]", "\"text\"", "1", "true"};
    for (const char* bad : kBad) {
        Json::Value document = parse(R"({"a":"{{x}}","b":null})");
        const std::string before = toString(document);
        VLIBCErrSet(0);
        EXPECT_FALSE(ReplaceVariables(parse(bad), document)) << bad;
        EXPECT_EQ(VLIBCErrGet(), ERR_BAD_PARAMETERS) << bad;
        EXPECT_EQ(toString(document), before) << bad;
    }
}
