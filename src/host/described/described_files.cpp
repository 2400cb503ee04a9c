#include "host/described/described_files.h"

#include <algorithm>

#include "base/files/file.h"

namespace tally {
namespace {

// Every component is a plain name, so the path stays below the folder.
bool isSafeRelativePath(std::string_view path) {
  for (;;) {
    const std::size_t slash = path.find('/');
    if (!isSafeFileName(path.substr(0, slash))) return false;
    if (slash == std::string_view::npos) return true;
    path.remove_prefix(slash + 1);
  }
}

std::vector<std::byte> toBytes(std::string_view text) {
  const auto* first = reinterpret_cast<const std::byte*>(text.data());
  return {first, first + text.size()};
}

}  // namespace

std::optional<std::vector<std::byte>> DescribedFiles::bytes(const KvObject& described) {
  if (const auto* data = kvCast<KvData>(&described)) {
    return std::vector<std::byte>(data->bytes().begin(), data->bytes().end());
  }
  const auto* name = kvCast<KvString>(&described);
  if (name == nullptr || !isSafeRelativePath(name->view())) {
    report("not bytes", "neither data nor the name of a file: " + kvText(&described));
    return std::nullopt;
  }
  const auto content = folder_.readFile(name->view(), kDescribedBytesLimit);
  if (!content) {
    report("unreadable files", content.error().message);
    return std::nullopt;
  }
  return toBytes(*content);
}

void DescribedFiles::report(std::string_view kind, std::string_view fault) const {
  log_->fault(fmt::format("device registry: {}", kind), "device registry: {}", fault);
}

}  // namespace tally
