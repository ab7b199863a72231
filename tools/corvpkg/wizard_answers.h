// The answers to a package's install wizard: its questions, answers that answer none of
// them, and asking on a terminal.
#pragma once

#include <json/json.h>

#include <string>
#include <vector>

namespace cli {

struct WizardQuestion {
    std::string key;
    std::string desc;
    Json::Value defaultValue;  // null when the question has none
};

// Every question of the wizard's steps, in order, wherever the steps nest their items.
std::vector<WizardQuestion> wizardQuestions(const Json::Value& wizard, const Json::Value& defaults);

// The keys of `answers` that no question asks, sorted.
std::vector<std::string> unknownAnswerKeys(const Json::Value& answers,
                                           const std::vector<WizardQuestion>& questions);

// The questions as JSON: [{"key", "desc", "default"}].
Json::Value questionsJson(const std::vector<WizardQuestion>& questions);

// Asks each question not yet in `answers` on standard error and reads the answer from
// standard input; an empty answer takes the default. False when input ends first.
bool askQuestions(const std::vector<WizardQuestion>& questions, Json::Value& answers);

}  // namespace cli
