#include "host/described/registry_description.h"

#include <set>

#include "host/described/described_driver.h"
#include "host/described/described_hub.h"
#include "kv/plist_codec.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {
namespace {

// Entries without an id are numbered from here, in the order of the file.
constexpr std::string_view kRegistryFile = "registry.plist";
constexpr std::uint64_t kFirstID = 0x100;
// What of an entry is not a property that clients see, and where it is kept for open().
constexpr std::string_view kHub = "Hub";
constexpr std::string_view kUserClient = "UserClient";

struct DescribedRegistryEntry final : RegistryEntry {
  KvRef<KvDictionary> hub;
  KvRef<KvDictionary> userClient;
};

std::optional<std::vector<std::uint64_t>> parseParents(const KvDictionary& description) {
  std::vector<std::uint64_t> parents;
  const KvObject* const value = description.get("Parents");
  if (value == nullptr) return parents;
  const auto* array = kvCast<KvArray>(value);
  if (array == nullptr) return std::nullopt;
  for (const auto& item : *array) {
    const auto* id = kvCast<KvNumber>(item.get());
    if (id == nullptr) return std::nullopt;
    parents.push_back(id->asUInt64());
  }
  return parents;
}

// False when the value of the key is not a dictionary.
bool takeDictionary(const KvDictionary& description, std::string_view key,
                    KvRef<KvDictionary>* result) {
  KvObject* const value = description.get(key);
  *result = KvRef<KvDictionary>::share(kvCast<KvDictionary>(value));
  return value == nullptr || *result;
}

// Null, with the reason, when it is malformed.
std::shared_ptr<DescribedRegistryEntry> parseEntry(const KvDictionary& description,
                                                   std::uint64_t id, std::string* fault) {
  auto entry = std::make_shared<DescribedRegistryEntry>();
  const auto className = description.getString("Class");
  if (!className || className->empty()) {
    *fault = "no Class";
    return nullptr;
  }
  entry->className = *className;
  entry->name = description.getString("Name").value_or(*className);
  const KvObject* const number = description.get("ID");
  if (number != nullptr && kvCast<KvNumber>(number) == nullptr) {
    *fault = "its ID is not a number";
    return nullptr;
  }
  entry->id = number != nullptr ? kvCast<KvNumber>(number)->asUInt64() : id;
  auto parents = parseParents(description);
  if (!parents) {
    *fault = "its Parents are not an array of numbers";
    return nullptr;
  }
  entry->parents = std::move(*parents);
  if (!takeDictionary(description, "Properties", &entry->properties) ||
      !takeDictionary(description, kHub, &entry->hub) ||
      !takeDictionary(description, kUserClient, &entry->userClient)) {
    *fault = "its Properties, Hub or UserClient is not a dictionary";
    return nullptr;
  }
  if (!entry->properties) entry->properties = KvDictionary::create();
  return entry;
}

}  // namespace

RegistryDescription::RegistryDescription(DeviceDirectory folder, std::shared_ptr<SystemLog> log)
    : folder_(std::move(folder)),
      files_(std::make_shared<DescribedFiles>(folder_, std::move(log))) {}

std::shared_ptr<const RegistrySource::Entries> RegistryDescription::entries() {
  const auto identity = folder_.identity(kRegistryFile);
  if (!entries_ || identity != identity_) {
    identity_ = identity;
    entries_ = identity ? read() : std::make_shared<const Entries>();
  }
  return entries_;
}

std::shared_ptr<const RegistrySource::Entries> RegistryDescription::read() {
  auto entries = std::make_shared<Entries>();
  const std::string path = folder_.text() + "/" + std::string(kRegistryFile);
  const auto content = folder_.readFile(kRegistryFile, kPlistMaximumBytes);
  if (!content) {
    files_->report("unreadable", content.error().message);
    return entries;
  }
  const auto root = decodePlist(*content);
  const auto* dictionary = root ? kvCast<KvDictionary>(root->get()) : nullptr;
  const auto* items = dictionary != nullptr ? dictionary->getAs<KvArray>("Entries") : nullptr;
  if (items == nullptr) {
    files_->report(
        "damaged",
        path + ": " + (root ? "not a dictionary with an Entries array" : root.error().message));
    return entries;
  }
  std::set<std::uint64_t> ids;
  for (std::size_t i = 0; i < items->size(); ++i) {
    std::string fault = "not a dictionary";
    const auto* description = items->getAs<KvDictionary>(i);
    auto entry = description != nullptr ? parseEntry(*description, kFirstID + i, &fault) : nullptr;
    if (entry && !ids.insert(entry->id).second) {
      fault = "an earlier entry has its ID";
      entry = nullptr;
    }
    if (entry) {
      entries->push_back(std::move(entry));
    } else {
      files_->report("entries skipped",
                     path + ": entry " + std::to_string(i + 1) + " skipped: " + fault);
    }
  }
  return entries;
}

std::unique_ptr<UserClient> RegistryDescription::open(const RegistryEntry& entry,
                                                      std::uint32_t type, RegistryResult* result) {
  const auto& described = static_cast<const DescribedRegistryEntry&>(entry);
  *result = kRegistryUnsupported;
  if (type != 0) return nullptr;
  if (described.className == kStatisticsHubClass) {
    return openDescribedHub(described.hub, entries(), files_, result);
  }
  return described.userClient ? openDescribedDriver(described.userClient, files_, result) : nullptr;
}

}  // namespace tally
