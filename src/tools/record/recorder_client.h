// The metrics daemon of a device root, as its clients reach it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string>

#include "base/result.h"

struct tallyclient;

namespace tally::tools {

constexpr const char* kMetricKeyRule =
    "a key is valid UTF-8 of 1 to 512 bytes, without control characters, colon, bar, hash or at "
    "sign";

// Buffers values and sends them. Other than a program that must not wait, it waits a few seconds
// for a daemon whose queue is full, so that nothing is dropped.
class RecorderClient {
 public:
  // The daemon need not be there. An error: its socket's path is too long.
  static Result<RecorderClient> open(const std::string& root);

  // Whether a metric may have the key.
  bool accepts(const std::string& key) const;
  // REQUIRES: the key is accepted, and all values are finite.
  Status set(const std::string& key, std::int64_t value);
  Status add(const std::string& key, std::int64_t amount);
  Status push(const std::string& key, std::span<const double> values);
  // Sends what is in the buffer. An error: there is no daemon, or it does not read.
  Status deliver();

 private:
  struct Close {
    void operator()(tallyclient* client) const;
  };
  Status makeSpace(std::size_t bytes);
  Status taken(int fault) const;

  std::string path_;
  std::unique_ptr<tallyclient, Close> client_;
  std::size_t waiting_ = 0;  // in the buffer: at most so many bytes
};

}  // namespace tally::tools
