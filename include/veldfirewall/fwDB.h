// SPDX-License-Identifier: Apache-2.0
// The profile database: one JSON file per profile, and the backup of the whole configuration.
#ifndef VELDFIREWALL_FWDB_H
#define VELDFIREWALL_FWDB_H

#include <json/value.h>

#include <map>
#include <string>
#include <vector>

#include "veldfirewall/export.h"
#include "veldfirewall/fwRecords.h"

namespace FW {

/// The store of firewall profiles in "/usr/veld/etc/firewall.d/". It holds no state: every operation scans the
/// directory once and locks file by file, so any number of processes and threads may use it; a sequence of operations
/// is not atomic. Profiles are found by the "name" in their document; the file name is an opaque number. Of two files
/// with one name, the one that sorts first counts. Files that are no profile documents are skipped.
///
/// Operations that return bool give true on success; every failure is logged at error priority. None of them throws
/// of its own accord, but JsonCpp's Json::LogicError passes through when a stored value cannot be converted (an
/// object where a number belongs), and so does the lock library's exception (see utils.h).
class VELDFIREWALL_API VELDFW_JSON_DB {
public:
    /// Fills `profile` from a profile document. Rules are appended to what `profile` already holds, so pass a fresh
    /// one for a plain load. Keys that are missing in a rule object read as 0, false or "" (not as the defaults of
    /// FWRULE), except that the lists stay empty and chainList always holds both firewall chains.
    /// @throws Json::LogicError when a value cannot be converted
    void jsonToProfile(const Json::Value &json, FWPROFILE &profile);
    /// Appends the rules of a "rules" member to `rules`, as jsonToProfile() does. Anything but an object or array is
    /// empty.
    /// @throws Json::LogicError when a value cannot be converted
    void jsonToRuleList(Json::Value json, std::map<std::string, std::vector<FWRULE>> &rules);
    /// Sets "name", "rules" and "adapterPolicyMap" of `json`; empty maps become null. Rules are numbered by position.
    void profileToJson(const FWPROFILE &profile, Json::Value &json);
    /// Appends every rule to the array of its adapter in `json`; an adapter without rules gets no member.
    void ruleListToJson(const std::map<std::string, std::vector<FWRULE>> &rules, Json::Value &json);

    /// Sets meta[name]["fileName"] (base name without extension) for every stored profile.
    /// @return false when the directory cannot be read or holds no JSON file at all
    bool profileMetaCreate(Json::Value &meta);
    /// Appends the names of all profiles in byte order. Fails as profileMetaCreate() does.
    bool profileEnum(std::vector<std::string> &names);
    /// Inserts every profile, loaded, under its name; names already in the map keep their value.
    bool profileEnum(std::map<std::string, FWPROFILE> &profiles);
    /// The full path of the profile's file, or an empty string when there is none.
    std::string profilePathGet(const std::string &name);
    /// A file name (no directory, no extension) that no member of `meta` has: decimal seconds since 1970 plus 0 to 99.
    /// Waits when all hundred are taken, until the clock offers a new one.
    std::string profilePathNameGen(const Json::Value &meta);
    /// Loads the stored document of the profile, undecoded.
    bool profileDbLoad(const std::string &name, Json::Value &json);
    /// Stores `json` as the document of profile `name`: over its file, or as a new file when there is none. A new file
    /// never replaces one that another process created meanwhile. `json`'s own "name" decides under which name it is
    /// found afterwards.
    bool profileDbDump(const std::string &name, const Json::Value &json);
    /// Deletes the profile's file and its lock file. @return always true, also for an unknown name
    bool profileDbRemove(const std::string &name);
    /// Whether a profile of that name is stored.
    bool profileExist(const std::string &name);
    /// Loads and decodes a profile into `profile`, appending (see jsonToProfile()).
    bool profileGet(const std::string &name, FWPROFILE &profile);
    /// Stores `profile` under `name`, creating or replacing it. The stored copy gets policy ALLOW for every adapter
    /// that has rules but no policy, and always NONE for "global".
    bool profileSet(const std::string &name, const FWPROFILE &profile);
    /// Stores a new, empty profile. @return false also when the name is taken
    bool profileCreate(const std::string &name);
    /// Renames a profile in its file, and in the settings when it is the active one.
    /// @return false also when `newName` is taken or `oldName` unknown; then nothing is changed
    bool profileRename(const std::string &oldName, const std::string &newName);
    /// Same as profileDbRemove().
    bool profileDelete(const std::string &name);

    /// Packs settings and all profile documents into `out`: "config_firewall_settings", "config_profiles" (file name
    /// to document) and "config_version" (1). A profile that cannot be read is logged and left out, unless it is the
    /// active one. @return false when the settings, the directory or the active profile cannot be read
    bool exportConfig(Json::Value &out);
    /// Replaces all profiles and the settings by those of `in`, a document made by exportConfig().
    ///
    /// The document must be trusted: nothing in it is checked. Old profiles are deleted first, so a document without
    /// "config_profiles" empties the store, and a failure half-way leaves a partly replaced configuration. Member names
    /// of "config_profiles" become file names as they are: a name with "/" or ".." writes outside the profile
    /// directory. Check before calling, and keep an exportConfig() to go back to: that "config_profiles" is a non-empty
    /// object; that every member name ends in ".json" and holds no "/" and is not hidden; that every member is an
    /// object with a string "name" and decodes with jsonToProfile(); that "config_firewall_settings" is an object whose
    /// "status" is a bool and whose "profile" is one of those names.
    /// @return false when the store cannot be scanned or the settings cannot be written; a profile that cannot be
    ///         deleted or written is logged and the import goes on
    /// @throws Json::LogicError, before anything is deleted, when `in` is neither an object nor null
    bool importConfig(const Json::Value &in);
};

}  // namespace FW

#endif
