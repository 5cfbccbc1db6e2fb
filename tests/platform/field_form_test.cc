// Fields are ordered alike, built or as they stand in a record.
#include "vxUtils/FieldForm.h"

#include <gtest/gtest.h>

#include <vector>

#include "vxUtils/ByteForms.h"

namespace vemo {
namespace {

// The form of `field` in front of `following` further bytes.
FieldForm FormOf(const FieldId& field, std::size_t following, Bytes& bytes) {
  bytes = ToBytes(field);
  const std::size_t size = bytes.size();
  bytes.insert(bytes.end(), following, 0xA5);
  BoundedReader reader(bytes);
  const FieldForm form = reader.ReadField();
  EXPECT_EQ(reader.offset(), size);
  return form;
}

// Steps at both sides of each length of a number.
std::vector<FieldId> Fields() {
  const std::vector<Path::Element> steps = {0,     1,       127,     128,       255,       256,       16383,
                                            16384, 2097151, 2097152, 268435455, 268435456, 4294967295};
  const std::vector<std::uint64_t> objects = {0, 1, 128, std::uint64_t{1} << 40, UINT64_MAX};
  std::vector<FieldId> fields;
  for (const std::uint64_t object : objects) {
    fields.push_back({OID(object), {}});
    for (const Path::Element step : steps) {
      fields.push_back({OID(object), {step}});
      fields.push_back({OID(object), {step, 0}});
      fields.push_back({OID(object), {3, step, 3}});
    }
  }
  for (const Path::Element step : steps) {
    fields.push_back({OID(7), {1, 2, 3, 4, 5, 6, step}});
    fields.push_back({OID(7), {1, 2, 3, 4, 5, 6, 0, step}});
    fields.push_back({OID(7), {1, 2, 3, 4, 5, 6, 0, 0, step}});
    fields.push_back({OID(7), {1, 2, 3, 4, 5, 6, 0, 0, step, 0}});
  }
  return fields;
}

TEST(FieldForm, OrdersAsFieldsDo) {
  const std::vector<FieldId> fields = Fields();
  Bytes aBytes, bBytes;
  for (const std::size_t following : {0u, 8u}) {
    for (const FieldId& a : fields) {
      const FieldForm aForm = FormOf(a, following, aBytes);
      for (const FieldId& b : fields) {
        const FieldForm bForm = FormOf(b, 8 - following, bBytes);
        ASSERT_EQ(FieldForm::IsBefore(aForm, bForm), a < b) << FieldIdText(a) << " and " << FieldIdText(b);
      }
    }
  }
}

}  // namespace
}  // namespace vemo
