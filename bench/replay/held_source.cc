#include "bench/replay/held_source.h"

#include <stdexcept>

namespace vemo::bench {

class HeldSource::Recorder : public EditVisitor {
 public:
  Recorder(HeldSource& held, std::size_t most) : m_held(held), m_most(most) {}

  void OnSite(const Guid& site, std::string_view author) override {
    Add({.kind = Event::Kind::kSite, .site = site, .texts = {std::string(author)}});
  }
  void OnObject(OID object, std::string_view path) override {
    Add({.kind = Event::Kind::kObject, .object = object, .texts = {std::string(path)}});
  }
  void OnCommit(const Commit& commit) override {
    Add({.kind = Event::Kind::kCommit,
         .site = commit.site,
         .texts = {std::string(commit.id), std::string(commit.author)}});
  }
  void OnEdit(const Edit& edit) override {
    Event event{.kind = Event::Kind::kEdit,
                .site = edit.site,
                .field = edit.field,
                .position = edit.position,
                .deleted = edit.deleted};
    for (const std::string_view element : edit.inserted) event.texts.emplace_back(element);
    if (Add(std::move(event))) ++m_held.m_edits;
  }

 private:
  bool Add(Event event) {
    if (m_held.m_edits == m_most) return false;
    m_held.m_events.push_back(std::move(event));
    return true;
  }

  HeldSource& m_held;
  std::size_t m_most;
};

HeldSource::HeldSource(EditSource& source, std::size_t edits)
    : m_description(source.Describe()), m_onlyField(source.OnlyField()) {
  source.CountEdits();
  Recorder recorder(*this, edits);
  source.Replay(recorder);
  if (m_edits < edits) {
    throw std::runtime_error(m_description + " has " + std::to_string(m_edits) + " edits, not " +
                             std::to_string(edits));
  }
}

void HeldSource::Replay(EditVisitor& visitor) {
  std::vector<std::string_view> inserted;
  for (const Event& event : m_events) {
    switch (event.kind) {
      case Event::Kind::kSite:
        visitor.OnSite(event.site, event.texts[0]);
        break;
      case Event::Kind::kObject:
        visitor.OnObject(event.object, event.texts[0]);
        break;
      case Event::Kind::kCommit:
        visitor.OnCommit({event.texts[0], event.texts[1], event.site});
        break;
      case Event::Kind::kEdit:
        inserted.assign(event.texts.begin(), event.texts.end());
        visitor.OnEdit({event.site, event.field, event.position, event.deleted, inserted});
        break;
    }
  }
}

}  // namespace vemo::bench
