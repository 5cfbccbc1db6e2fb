// Standard iterators made from a position that can step and be dereferenced.
#pragma once

#include <cstddef>
#include <iterator>
#include <memory>

namespace vemo {

// `Policy` has value_type, next(), prev(), deref(), const_deref() and operator==.
template <class Policy>
class make_iterator : public Policy {
 public:
  using iterator_category = std::bidirectional_iterator_tag;
  using value_type = typename Policy::value_type;
  using difference_type = std::ptrdiff_t;
  using pointer = value_type*;
  using reference = value_type&;

  make_iterator() = default;
  explicit make_iterator(const Policy& policy) : Policy(policy) {}

  reference operator*() const { return this->deref(); }
  pointer operator->() const { return std::addressof(this->deref()); }

  make_iterator& operator++() {
    this->next();
    return *this;
  }
  make_iterator operator++(int) {
    make_iterator before = *this;
    this->next();
    return before;
  }
  make_iterator& operator--() {
    this->prev();
    return *this;
  }
  make_iterator operator--(int) {
    make_iterator before = *this;
    this->prev();
    return before;
  }
};

// The same over constant values; every iterator converts to one.
template <class Policy>
class make_const_iterator : public Policy {
 public:
  using iterator_category = std::bidirectional_iterator_tag;
  using value_type = typename Policy::value_type;
  using difference_type = std::ptrdiff_t;
  using pointer = const value_type*;
  using reference = const value_type&;

  make_const_iterator() = default;
  explicit make_const_iterator(const Policy& policy) : Policy(policy) {}
  make_const_iterator(const make_iterator<Policy>& other) : Policy(other) {}

  reference operator*() const { return this->const_deref(); }
  pointer operator->() const { return std::addressof(this->const_deref()); }

  make_const_iterator& operator++() {
    this->next();
    return *this;
  }
  make_const_iterator operator++(int) {
    make_const_iterator before = *this;
    this->next();
    return before;
  }
  make_const_iterator& operator--() {
    this->prev();
    return *this;
  }
  make_const_iterator operator--(int) {
    make_const_iterator before = *this;
    this->prev();
    return before;
  }
};

}  // namespace vemo
