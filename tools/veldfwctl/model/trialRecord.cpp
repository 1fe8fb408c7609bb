// SPDX-License-Identifier: Apache-2.0
// What is known of a trial: written when it begins, read by whoever asks.
#include "model/trialRecord.h"

#include <json/reader.h>
#include <json/writer.h>

#include <array>
#include <memory>

namespace veldfwctl {

namespace {

constexpr std::array<const char *, 5> PHASES = {"applying", "on trial", "kept", "taken back", "failed"};
constexpr size_t TEXT_SIZE = 512;  // what is not ASCII takes up to six bytes for each

}  // namespace

const char *trialPhaseText(TrialPhase phase) {
    return PHASES.at(static_cast<size_t>(phase));
}

bool isOpen(TrialPhase phase) {
    return phase == TrialPhase::APPLYING || phase == TrialPhase::ON_TRIAL;
}

std::string trialRecordText(const TrialRecord &record) {
    Json::Value json;
    json["profile"] = record.profile;
    json["previous"] = record.previous;
    json["wasEnabled"] = record.wasEnabled;
    json["atomic"] = record.atomic;
    json["phase"] = trialPhaseText(record.phase);
    json["watch"] = record.watch;
    json["until"] = static_cast<Json::Int64>(record.until);
    json["text"] = record.text.substr(0, TEXT_SIZE);
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    std::string text = Json::writeString(builder, json);
    text.resize(TRIAL_RECORD_SIZE, ' ');
    return text;
}

std::optional<TrialRecord> trialRecordParse(const std::string &text) {
    Json::Value json;
    const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
    if (!reader->parse(text.data(), text.data() + text.size(), &json, nullptr) || !json.isObject()) {
        return std::nullopt;
    }
    try {
        TrialRecord record;
        record.profile = json["profile"].asString();
        record.previous = json["previous"].asString();
        record.wasEnabled = json["wasEnabled"].asBool();
        record.atomic = json["atomic"].asBool();
        record.watch = json["watch"].asInt();
        record.until = json["until"].asInt64();
        record.text = json["text"].asString();
        for (size_t i = 0; i < PHASES.size(); ++i) {
            if (json["phase"] == PHASES.at(i)) {
                record.phase = static_cast<TrialPhase>(i);
                return record;
            }
        }
    } catch (const Json::Exception &) {
        // A member of another type: no record.
    }
    return std::nullopt;
}

}  // namespace veldfwctl
