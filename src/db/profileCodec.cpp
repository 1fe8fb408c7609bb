// SPDX-License-Identifier: Apache-2.0
// Conversion between profiles and their JSON documents. Lenient: nothing is validated.
#include "db/profileCodec.h"

namespace FW {

namespace {

template <typename Container> void stringsDecode(const Json::Value &json, Container &strings) {
    for (const Json::Value &item : json) {
        strings.insert(strings.end(), item.asString());
    }
}

template <typename Container> Json::Value stringsEncode(const Container &strings) {
    Json::Value json(Json::arrayValue);
    for (const std::string &item : strings) {
        json.append(item);
    }
    return json;
}

// Every scalar is read, present or not: a missing one overrides the record's default with 0, false or "".
FWRULE ruleDecode(const Json::Value &json) {
    FWRULE rule;
    rule.ruleIndex = json["ruleID"].asInt();
    rule.enable = json["enable"].asBool();
    rule.adapterDirect = json["adapterDirect"].asInt();
    rule.protocol = json["protocol"].asInt();
    rule.policy = static_cast<FW_POLICY>(json["policy"].asInt());
    rule.blLog = json["blLog"].asBool();
    rule.name = json["name"].asString();
    rule.table = json["table"].asString();
    stringsDecode(json["labelList"], rule.labelList);
    stringsDecode(json["chainList"], rule.chainList);
    rule.ipType = json["ipType"].asInt();
    rule.ipDirect = json["ipDirect"].asInt();
    rule.ipGroup = json["ipGroup"].asInt();
    stringsDecode(json["ipList"], rule.ipList);
    rule.portDirect = json["portDirect"].asInt();
    rule.portGroup = json["portGroup"].asInt();
    stringsDecode(json["portList"], rule.portList);
    return rule;
}

// "ruleIndex" is the position and is never read back; "ruleID" is what a rule brings along and is never written.
// Static keys are not copied, and there are many.
Json::Value ruleEncode(const FWRULE &rule, unsigned position) {
    Json::Value json(Json::objectValue);
    const auto member = [&json](const char *key) -> Json::Value & { return json[Json::StaticString(key)]; };
    member("ruleIndex") = position;
    member("enable") = rule.enable;
    member("adapterDirect") = rule.adapterDirect;
    member("protocol") = rule.protocol;
    member("policy") = static_cast<int>(rule.policy);
    member("blLog") = rule.blLog;
    member("name") = rule.name;
    member("table") = rule.table;
    member("labelList") = stringsEncode(rule.labelList);
    member("chainList") = stringsEncode(rule.chainList);
    member("ipType") = rule.ipType;
    member("ipDirect") = rule.ipDirect;
    member("ipGroup") = rule.ipGroup;
    member("ipList") = stringsEncode(rule.ipList);
    member("portDirect") = rule.portDirect;
    member("portGroup") = rule.portGroup;
    member("portList") = stringsEncode(rule.portList);
    return json;
}

}  // namespace

void rulesDecode(const Json::Value &json, std::map<std::string, std::vector<FWRULE>> &rules) {
    for (auto adapter = json.begin(); adapter != json.end(); ++adapter) {
        const Json::ArrayIndex count = adapter->size();  // 0 of a scalar as well
        if (count == 0) {
            continue;
        }
        std::vector<FWRULE> &list = rules[adapter.name()];
        list.reserve(list.size() + count);
        for (const Json::Value &rule : *adapter) {
            list.push_back(ruleDecode(rule));
        }
    }
}

void profileDecode(const Json::Value &json, FWPROFILE &profile) {
    profile.name = json["name"].asString();
    rulesDecode(json["rules"], profile.rules);
    const Json::Value &policies = json["adapterPolicyMap"];
    for (auto policy = policies.begin(); policy != policies.end(); ++policy) {
        profile.adapterPolicyMap[policy.name()] = static_cast<FW_POLICY>(policy->asInt());
    }
}

void rulesEncode(const std::map<std::string, std::vector<FWRULE>> &rules, Json::Value &json) {
    for (const auto &[adapter, list] : rules) {
        unsigned position = 0;
        for (const FWRULE &rule : list) {
            if (!json.isMember(adapter)) {
                json[adapter] = Json::Value(Json::arrayValue);
            }
            json[adapter].append(ruleEncode(rule, position++));
        }
    }
}

void profileEncode(const FWPROFILE &profile, Json::Value &json) {
    json["name"] = profile.name;
    rulesEncode(profile.rules, json["rules"]);
    Json::Value &policies = json["adapterPolicyMap"];
    policies = Json::Value();
    for (const auto &[adapter, policy] : profile.adapterPolicyMap) {
        policies[adapter] = static_cast<int>(policy);
    }
}

void adapterPoliciesComplete(FWPROFILE &profile) {
    for (const auto &[adapter, list] : profile.rules) {
        profile.adapterPolicyMap.emplace(adapter, FW_POLICY_ALLOW);
    }
    profile.adapterPolicyMap[FW_ADAPTER_GLOBAL] = FW_POLICY_NONE;
}

}  // namespace FW
