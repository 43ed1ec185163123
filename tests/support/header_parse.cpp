#include "tests/support/header_parse.h"

#include <cstring>

#include "core/header/element_walker.h"

namespace testing_support {

HeaderParse::HeaderParse(ebml::Bytes bytes, HeaderParseOptions options)
    : bytes_(std::move(bytes)),
      input_(host::MakeMemoryStream(bytes_.data(), bytes_.size(), options.seekable)),
      info_(std::make_unique<mkv_file_info>()) {
  std::memset(info_.get(), 0, sizeof(mkv_file_info));
  limits_.input_seekable = options.seekable ? 1 : 0;
  if (options.with_limits) info_->parse_limits = &limits_;
  info_->metadata = options.metadata;
  stream_ready_ = mkvvstream_init(&stream_, input_->record(), 480, 1, kFillWithRead, options.seekable ? 1 : 0) == 0;
}

HeaderParse::~HeaderParse() {
  destroy_mkv_file_info(info_.get());
  if (stream_ready_) mkvvstream_destroy(&stream_);
}

int HeaderParse::Parse() { return parse_mkvfile(info_.get(), &stream_); }

int HeaderParse::Validate() { return valid_mkv(&stream_, info_.get()); }

}  // namespace testing_support
