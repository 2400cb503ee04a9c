#include "hwreport/sampling/interest_list.h"

#include <algorithm>
#include <bit>

#include "hwreport/channels/type_word.h"

namespace tally {

void InterestList::add(const ChannelFrame& channels) {
  static_assert(std::endian::native == std::endian::little);
  const ChannelRows& rows = channels.rows();
  count_ += channels.size();
  words_[0] = static_cast<std::uint32_t>(count_);
  words_.reserve(words_.size() + channels.size() * 3);
  for (std::size_t i = 0; i < channels.size() && complete(); ++i) {
    const std::size_t row = channels.rowOf(i);
    rows.prefetchLegends(row);
    const KvArray* const legend = rows.legend(row);
    const auto wordOf = [&](std::size_t index) {
      return bitsOf(legend != nullptr ? legend->get(index) : nullptr);
    };
    const std::uint64_t interest[] = {bitsOf(rows.shape(row).driverID), wordOf(kLegendChannelID),
                                      wordOf(kLegendTypeWord)};
    complete_ = std::ranges::find(interest, kHwReportInvalidValue) == std::end(interest);
    words_.insert(words_.end(), std::begin(interest), std::end(interest));
  }
}

}  // namespace tally
