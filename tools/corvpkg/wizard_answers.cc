#include "wizard_answers.h"

#include <stdio.h>

#include <algorithm>
#include <iostream>

namespace cli {

namespace {

void collect(const Json::Value& node, const Json::Value& defaults,
             std::vector<WizardQuestion>& out) {
    if (node.isArray()) {
        for (const Json::Value& element : node) {
            collect(element, defaults, out);
        }
        return;
    }
    if (!node.isObject()) {
        return;
    }
    if (node["key"].isString()) {
        WizardQuestion question;
        question.key = node["key"].asString();
        question.desc = node["desc"].isString() ? node["desc"].asString() : "";
        if (defaults.isMember(question.key)) {
            question.defaultValue = defaults[question.key];
        }
        out.push_back(question);
    }
    for (const std::string& member : node.getMemberNames()) {
        if (node[member].isArray() || node[member].isObject()) {
            collect(node[member], defaults, out);
        }
    }
}

std::string shown(const Json::Value& value) {
    return value.isString() ? value.asString()
                            : value.toStyledString().substr(0, value.toStyledString().find('\n'));
}

}  // namespace

std::vector<WizardQuestion> wizardQuestions(const Json::Value& wizard,
                                            const Json::Value& defaults) {
    std::vector<WizardQuestion> out;
    collect(wizard, defaults, out);
    return out;
}

std::vector<std::string> unknownAnswerKeys(const Json::Value& answers,
                                           const std::vector<WizardQuestion>& questions) {
    std::vector<std::string> unknown;
    for (const std::string& key : answers.getMemberNames()) {
        if (std::none_of(questions.begin(), questions.end(),
                         [&](const WizardQuestion& q) { return q.key == key; })) {
            unknown.push_back(key);
        }
    }
    std::sort(unknown.begin(), unknown.end());
    return unknown;
}

Json::Value questionsJson(const std::vector<WizardQuestion>& questions) {
    Json::Value out(Json::arrayValue);
    for (const WizardQuestion& question : questions) {
        Json::Value item(Json::objectValue);
        item["key"] = question.key;
        item["desc"] = question.desc;
        item["default"] = question.defaultValue;
        out.append(item);
    }
    return out;
}

bool askQuestions(const std::vector<WizardQuestion>& questions, Json::Value& answers) {
    for (const WizardQuestion& question : questions) {
        if (answers.isMember(question.key)) {
            continue;
        }
        const std::string label = question.desc.empty() ? question.key : question.desc;
        if (question.defaultValue.isNull()) {
            fprintf(stderr, "%s (%s): ", label.c_str(), question.key.c_str());
        } else {
            fprintf(stderr, "%s (%s) [%s]: ", label.c_str(), question.key.c_str(),
                    shown(question.defaultValue).c_str());
        }
        fflush(stderr);
        std::string line;
        if (!std::getline(std::cin, line)) {
            fputc('\n', stderr);
            return false;
        }
        if (line.empty() && !question.defaultValue.isNull()) {
            answers[question.key] = question.defaultValue;
        } else {
            answers[question.key] = line;
        }
    }
    return true;
}

}  // namespace cli
