#include "tools/reading/walk_facts.h"

#include <vector>

#include "host/input_streams.h"
#include "stream/mkvvstream.h"

namespace reading {

namespace {

constexpr int64_t kWalkBufferSize = 16 << 10;

bool Descends(uint32_t id) {
  switch (id) {
    case ids::kSegment: case ids::kSeekHead: case ids::kSeek: case ids::kInfo: case ids::kTracks:
    case ids::kTrackEntry: case ids::kTags: case ids::kTag: case ids::kTargets: case ids::kSimpleTag:
    case ids::kChapters: case ids::kEditionEntry: case ids::kChapterAtom: case ids::kChapterDisplay:
    case ids::kAttachments: case ids::kAttachedFile:
      return true;
    default:
      return false;
  }
}

class FactCollector : public ElementVisitor {
 public:
  explicit FactCollector(FileFacts* facts) : facts_(facts) {}

  bool Enter(const Element& element) override {
    if (!Descends(element.id)) return false;
    switch (element.id) {
      case ids::kInfo:
        // A later Info replaces an earlier one, as in the header parse.
        facts_->info.duration_ticks.reset();
        facts_->info.date_utc_ns.reset();
        break;
      case ids::kTrackEntry: track_number_ = 0; language_ietf_.reset(); break;
      case ids::kTag: facts_->tags.emplace_back(); break;
      case ids::kSimpleTag:
        if (!facts_->tags.empty()) {
          facts_->tags.back().simple_tags.emplace_back();
          open_simple_.push_back(facts_->tags.back().simple_tags.size() - 1);
          facts_->tags.back().simple_tags.back().depth = static_cast<int>(open_simple_.size()) - 1;
        }
        break;
      case ids::kEditionEntry: facts_->editions.emplace_back(); break;
      case ids::kChapterAtom: {
        if (facts_->editions.empty()) return false;
        auto& siblings = open_chapters_.empty() ? facts_->editions.back().chapters : open_chapters_.back()->children;
        siblings.emplace_back();
        open_chapters_.push_back(&siblings.back());
        break;
      }
      case ids::kChapterDisplay:
        if (open_chapters_.empty()) return false;
        open_chapters_.back()->names.emplace_back();
        break;
      case ids::kAttachedFile: facts_->attachments.emplace_back(); break;
      default: break;
    }
    return true;
  }

  void Leave(const Element& element) override {
    switch (element.id) {
      case ids::kTrackEntry:
        for (TrackFacts& track : facts_->tracks) {
          if (track.number == track_number_ && language_ietf_) track.language_ietf = language_ietf_;
        }
        break;
      case ids::kSimpleTag:
        if (!open_simple_.empty()) open_simple_.pop_back();
        break;
      case ids::kChapterAtom:
        if (!open_chapters_.empty()) open_chapters_.pop_back();
        break;
      case ids::kChapterDisplay:
        if (!open_chapters_.empty() && !open_chapters_.back()->names.empty()) {
          ChapterName& name = open_chapters_.back()->names.back();
          if (name.languages.empty()) name.languages.push_back("eng");
        }
        break;
      default: break;
    }
  }

  void Leaf(const Element& element) override {
    if (!element.has_value) return;
    const uint64_t number = element.uint_value;
    const std::string& text = element.bytes;
    switch (element.id) {
      case ids::kDuration: facts_->info.duration_ticks = element.float_value; break;
      case ids::kDateUtc: facts_->info.date_utc_ns = element.int_value; break;
      case ids::kTrackNumber: track_number_ = number; break;
      case ids::kLanguageIetf: language_ietf_ = text; break;
      case ids::kTargetTypeValue: Tag([&](TagFacts& tag) { tag.target_type_value = number; }); break;
      case ids::kTargetType: Tag([&](TagFacts& tag) { tag.target_type = text; }); break;
      case ids::kTagTrackUid: Tag([&](TagFacts& tag) { tag.track_uids.push_back(number); }); break;
      case ids::kTagEditionUid: Tag([&](TagFacts& tag) { tag.edition_uids.push_back(number); }); break;
      case ids::kTagChapterUid: Tag([&](TagFacts& tag) { tag.chapter_uids.push_back(number); }); break;
      case ids::kTagAttachmentUid: Tag([&](TagFacts& tag) { tag.attachment_uids.push_back(number); }); break;
      case ids::kTagName: Simple([&](SimpleTagFacts& simple) { simple.name = text; }); break;
      case ids::kTagString: Simple([&](SimpleTagFacts& simple) { simple.value = text; }); break;
      case ids::kTagBinary: Simple([&](SimpleTagFacts& simple) { simple.binary = true; }); break;
      case ids::kTagLanguage: Simple([&](SimpleTagFacts& simple) { simple.language = text; }); break;
      case ids::kTagDefault: Simple([&](SimpleTagFacts& simple) { simple.is_default = number != 0; }); break;
      case ids::kEditionUid: Edition([&](EditionFacts& edition) { edition.uid = number; }); break;
      case ids::kEditionFlagHidden: Edition([&](EditionFacts& edition) { edition.hidden = number != 0; }); break;
      case ids::kEditionFlagDefault: Edition([&](EditionFacts& edition) { edition.is_default = number != 0; }); break;
      case ids::kEditionFlagOrdered: Edition([&](EditionFacts& edition) { edition.ordered = number != 0; }); break;
      case ids::kChapterUid: Chapter([&](ChapterFacts& chapter) { chapter.uid = number; }); break;
      case ids::kChapterTimeStart: Chapter([&](ChapterFacts& chapter) { chapter.start_ns = number; }); break;
      case ids::kChapterTimeEnd: Chapter([&](ChapterFacts& chapter) { chapter.end_ns = number; }); break;
      case ids::kChapterFlagHidden: Chapter([&](ChapterFacts& chapter) { chapter.hidden = number != 0; }); break;
      case ids::kChapterFlagEnabled: Chapter([&](ChapterFacts& chapter) { chapter.enabled = number != 0; }); break;
      case ids::kChapString: Name([&](ChapterName& name) { name.text = text; }); break;
      case ids::kChapLanguage: Name([&](ChapterName& name) { name.languages.push_back(text); }); break;
      case ids::kChapLanguageIetf: Name([&](ChapterName& name) { name.languages_ietf.push_back(text); }); break;
      case ids::kFileUid: Attachment([&](AttachmentFacts& file) { file.uid = number; }); break;
      case ids::kFileName: Attachment([&](AttachmentFacts& file) { file.name = text; }); break;
      case ids::kFileMimeType: Attachment([&](AttachmentFacts& file) { file.mime_type = text; }); break;
      case ids::kFileDescription: Attachment([&](AttachmentFacts& file) { file.description = text; }); break;
      case ids::kFileData:
        Attachment([&](AttachmentFacts& file) {
          file.size = element.data_size;
          file.data_offset = element.data_offset();
        });
        break;
      default: break;
    }
  }

 private:
  template <typename F> void Tag(F f) { if (!facts_->tags.empty()) f(facts_->tags.back()); }
  template <typename F> void Simple(F f) {
    if (!facts_->tags.empty() && !open_simple_.empty()) f(facts_->tags.back().simple_tags[open_simple_.back()]);
  }
  template <typename F> void Edition(F f) { if (!facts_->editions.empty()) f(facts_->editions.back()); }
  template <typename F> void Chapter(F f) { if (!open_chapters_.empty()) f(*open_chapters_.back()); }
  template <typename F> void Name(F f) {
    if (!open_chapters_.empty() && !open_chapters_.back()->names.empty()) f(open_chapters_.back()->names.back());
  }
  template <typename F> void Attachment(F f) { if (!facts_->attachments.empty()) f(facts_->attachments.back()); }

  FileFacts* facts_;
  uint64_t track_number_ = 0;
  std::optional<std::string> language_ietf_;
  std::vector<size_t> open_simple_;          // the SimpleTags being read, outermost first
  std::vector<ChapterFacts*> open_chapters_;  // the ChapterAtoms being read, outermost first
};

}  // namespace

WalkEnd WalkFile(const std::string& path, ElementVisitor& visitor, const WalkOptions& options, bool* opened) {
  auto input = host::OpenFileStream(path, true);
  mkvvstream stream;
  *opened = input && mkvvstream_init(&stream, input->record(), kWalkBufferSize, 1, kFillWithRead, 1) == 0;
  if (!*opened) return {};
  WalkEnd end = WalkElements(&stream, visitor, options);
  mkvvstream_destroy(&stream);
  return end;
}

bool WalkFacts(const std::string& path, FileFacts* facts) {
  FileFacts walked = *facts;
  walked.tags.clear();
  FactCollector collector(&walked);
  WalkOptions options;
  options.jump_over_clusters = true;
  bool opened = false;
  WalkEnd end = WalkFile(path, collector, options, &opened);
  if (!opened) return false;
  walked.walked = true;
  if (!end.complete) walked.walk_stopped = "stopped at byte " + std::to_string(end.stopped_at) + ": " + end.reason;
  *facts = std::move(walked);
  return true;
}

}  // namespace reading
