#include "tools/preview.h"

#include <map>
#include <memory>
#include <utility>

#include "kv/plist_codec.h"
#include "platform/platform.h"

namespace tally::tools {
namespace {

// Preferences whose writes are seen by later reads and go nowhere else.
class OverlayPreferences final : public Preferences {
 public:
  explicit OverlayPreferences(std::shared_ptr<Preferences> base) : base_(std::move(base)) {}
  KvRef<KvObject> SMAPreferencesGetValue(std::string_view key, std::string_view domain) override {
    const auto written = written_.find({std::string(domain), std::string(key)});
    if (written != written_.end()) return written->second;
    return base_->SMAPreferencesGetValue(key, domain);
  }
  void SMAPreferencesSetValue(std::string_view key, KvRef<KvObject> value,
                              std::string_view domain) override {
    written_.insert_or_assign({std::string(domain), std::string(key)}, std::move(value));
  }
  bool SMAPreferencesSynchronize(std::string_view) override { return true; }

 private:
  std::shared_ptr<Preferences> base_;
  std::map<std::pair<std::string, std::string>, KvRef<KvObject>> written_;  // by domain and key
};

class CapturingSubmission final : public LogSubmission {
 public:
  explicit CapturingSubmission(Preview& preview) : preview_(preview) {}
  bool SMAWriteLogForSubmission(std::string_view, std::string_view, const KvDictionary* options,
                                const KvObject*, const Writer& writer) override {
    struct Body final : LogFile {
      std::string text;
      bool write(std::string_view bytes) override {
        text += bytes;
        return true;
      }
    } body;
    writer(body);
    preview_.body = std::move(body.text);
    preview_.options = options != nullptr ? options->copy() : nullptr;
    return true;
  }

 private:
  Preview& preview_;
};

}  // namespace

Preview previewLog(std::int32_t day, KeyTrace* trace) {
  Preview preview;
  Platform variant = platform();
  variant.preferences = std::make_shared<OverlayPreferences>(variant.preferences);
  variant.logSubmission = std::make_shared<CapturingSubmission>(preview);
  const PlatformScope scope(std::move(variant));
  TBReport report;
  if (trace != nullptr) report.follow(*trace);
  report.writeLogForYesterdayWithAppInfo(day, nullptr);
  if (const auto root = decodePlist(preview.body)) {
    preview.document = KvRef<KvDictionary>::share(kvCast<KvDictionary>(root->get()));
  }
  return preview;
}

}  // namespace tally::tools
