#pragma once
// Runs the header parse over bytes in memory, the way the filter's creators do
// (480-byte stream buffer, read-through), and keeps everything alive for the
// test to inspect.

#include <memory>

#include "core/file_model.h"
#include "core/header/element_walker.h"
#include "host/input_streams.h"
#include "stream/mkvvstream.h"
#include "tests/support/ebml_builder.h"

namespace testing_support {

struct HeaderParseOptions {
  bool seekable = true;
  bool with_limits = true;  // the creators' limits: 8192-byte strings
  mkv_metadata_list* metadata = nullptr;  // handed in as the creators do; owned by the test
};

class HeaderParse {
 public:
  explicit HeaderParse(ebml::Bytes bytes, HeaderParseOptions options = {})
      : bytes_(std::move(bytes)), input_(host::MakeMemoryStream(bytes_.data(), bytes_.size(), options.seekable)) {
    limits_.input_seekable = options.seekable ? 1 : 0;
    if (options.with_limits) info_->parse_limits = &limits_;
    info_->metadata = options.metadata;
    stream_ready_ = mkvvstream_init(&stream_, input_->record(), 480, 1, kFillWithRead, options.seekable ? 1 : 0) == 0;
  }
  ~HeaderParse() {
    destroy_mkv_file_info(info_.get());
    if (stream_ready_) mkvvstream_destroy(&stream_);
  }
  HeaderParse(const HeaderParse&) = delete;
  HeaderParse& operator=(const HeaderParse&) = delete;

  // parse_mkvfile's answer; valid_mkv's with Validate().
  int Parse() { return parse_mkvfile(info_.get(), &stream_); }
  int Validate() { return valid_mkv(&stream_, info_.get()); }

  mkv_file_info& info() { return *info_; }
  mkvvstream& stream() { return stream_; }
  host::InputStream& input() { return *input_; }

 private:
  ebml::Bytes bytes_;
  std::unique_ptr<host::InputStream> input_;
  mkvvstream stream_{};
  bool stream_ready_ = false;
  mkv_parse_limits limits_{kDefaultMaxStringSize, 1};
  std::unique_ptr<mkv_file_info> info_ = std::make_unique<mkv_file_info>();
};

}  // namespace testing_support
