#include "tools/frame/dry_run.h"

#include <map>
#include <utility>

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
  WriteResult SMAPreferencesSynchronize(std::string_view) override { return WriteResult::Written; }
  bool isReadable(std::string_view domain) override { return base_->isReadable(domain); }

 private:
  std::shared_ptr<Preferences> base_;
  std::map<std::pair<std::string, std::string>, KvRef<KvObject>> written_;  // by domain and key
};

class KeptSubmission final : public LogSubmission {
 public:
  explicit KeptSubmission(DryRun& run) : run_(run) {}
  bool SMAWriteLogForSubmission(std::string_view typeCode, std::string_view name,
                                const KvDictionary* options, const KvObject*,
                                const Writer& writer) override {
    struct Body final : LogFile {
      std::string text;
      bool isWhole = true;
      bool write(std::string_view bytes) override {
        text += bytes;
        return true;
      }
      void abandon(const Error&) override { isWhole = false; }
    } body;
    writer(body);
    if (!body.isWhole) return false;
    run_.logs.push_back({std::string(typeCode), std::string(name), std::move(body.text),
                         options != nullptr ? options->copy() : nullptr});
    return true;
  }

 private:
  DryRun& run_;
};

class CountedCrashReporting final : public CrashReporting {
 public:
  CountedCrashReporting(DryRun& run, std::shared_ptr<CrashReporting> base)
      : run_(run), base_(std::move(base)) {}
  bool isDiagnosticSubmissionEnabled() override { return base_->isDiagnosticSubmissionEnabled(); }
  void FDLogStructuredData(std::uint32_t, const KvDictionary&) override { ++run_.records; }
  void FDDumpAllOldStructuredDataLogs() override {}
  void rollFixlineLogs() override {}

 private:
  DryRun& run_;
  std::shared_ptr<CrashReporting> base_;
};

}  // namespace

// Whoever adds a service decides here whether it has effects that a dry run must keep back.
static_assert(sizeof(Platform) == 28 * sizeof(std::shared_ptr<void>));

Platform DryRun::variantOf(const Platform& platform) {
  Platform variant = platform;
  variant.preferences = std::make_shared<OverlayPreferences>(variant.preferences);
  variant.logSubmission = std::make_shared<KeptSubmission>(*this);
  variant.crashReporting = std::make_shared<CountedCrashReporting>(*this, variant.crashReporting);
  variant.dailyCounters = std::make_shared<DailyCounters>();
  variant.recorder = std::make_shared<RecorderLink>();
  return variant;
}

}  // namespace tally::tools
