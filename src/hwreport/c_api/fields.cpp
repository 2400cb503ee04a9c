#include "hwreport/c_api/fields.h"

#include "hwreport/c_api/handles.h"
#include "hwreport/channel.h"
#include "hwreport/descriptions.h"

namespace tally {
namespace {

template <auto Get>
auto readField(KvDictionary* channel) {
  return Get(channel);
}
template <auto Get>
std::uint64_t readNumber(KvDictionary* channel) {
  return Get(channel);
}

struct TextField {
  int field;
  CTextReader read;
};
constexpr TextField kTextFields[] = {
    {HWREPORT_NAME, HwReportChannelGetChannelName},
    {HWREPORT_GROUP, readField<HwReportChannelGetGroup>},
    {HWREPORT_SUBGROUP, readField<HwReportChannelGetSubGroup>},
    {HWREPORT_DRIVER_NAME, readField<HwReportChannelGetDriverName>},
    {HWREPORT_UNIT_LABEL, HwReportChannelGetUnitLabel},
};

struct NumberField {
  int field;
  CNumberReader read;
};
constexpr NumberField kNumberFields[] = {
    {HWREPORT_FORMAT, readNumber<HwReportChannelGetFormat>},
    {HWREPORT_CATEGORIES, readNumber<HwReportChannelGetCategories>},
    {HWREPORT_UNIT, readNumber<HwReportChannelGetUnit>},
    {HWREPORT_DRIVER_ID, readNumber<HwReportChannelGetDriverID>},
    {HWREPORT_CHANNEL_ID, readNumber<HwReportChannelGetChannelID>},
};

template <class Field, std::size_t Size>
auto readerIn(const Field (&fields)[Size], int field) noexcept -> decltype(fields[0].read) {
  for (const Field& row : fields) {
    if (row.field == field) return row.read;
  }
  return nullptr;
}

}  // namespace

CTextReader textReaderOf(int field) noexcept { return readerIn(kTextFields, field); }
CNumberReader numberReaderOf(int field) noexcept { return readerIn(kNumberFields, field); }

}  // namespace tally

using namespace tally;

int hwreport_text(hwreport_channels* channels, size_t index, int field, const char** text) {
  return cCall([&] {
    if (!cClear(text, "")) return cBadArgument("the text's output is NULL");
    const CTextReader read = textReaderOf(field);
    if (read == nullptr) return cBadArgument("no such text field");
    KvDictionary* const channel = channelOfSet(channels, index);
    if (channel == nullptr) return kCBadArgument;
    const KvString* const found = read(channel);
    if (found == nullptr) return cFailure(HWREPORT_NO_VALUE, "the channel has no such text");
    *text = found->view().data();
    return kCOk;
  });
}

int hwreport_number(hwreport_channels* channels, size_t index, int field, uint64_t* number) {
  return cCall([&] {
    if (!cClear(number)) return cBadArgument("the number's output is NULL");
    const CNumberReader read = numberReaderOf(field);
    if (read == nullptr) return cBadArgument("no such number field");
    KvDictionary* const channel = channelOfSet(channels, index);
    if (channel == nullptr) return kCBadArgument;
    const std::uint64_t found = read(channel);
    if (found == kHwReportInvalidValue) {
      return cFailure(HWREPORT_NO_VALUE, "the channel has no such number");
    }
    *number = found;
    return kCOk;
  });
}
