// Iterator objects over the vectors: a small polymorphic class tree whose objects hold a position in
// one vector and, for the closed kinds, the range they may move in and a counted reference to the
// vector's script object. Scripts hold them through proxies of the single iterator descriptor.
#pragma once

#include <cstddef>
#include <iterator>
#include <span>
#include <stdexcept>
#include <type_traits>
#include <vector>

#include "convert/scalar.h"
#include "convert/text.h"
#include "runtime/runtime.h"
#include "runtime/wrap.h"
#include "types/types.h"

namespace client3 {

// The iterator class's module functions (iterators.cpp).
std::span<const PyMethodDef> IteratorFunctions();

}  // namespace client3

namespace swig {

// Thrown when a closed iterator would leave its range, and by the base decr.
struct stop_iteration {};

class SwigPyIterator {
 public:
  virtual ~SwigPyIterator() { Py_XDECREF(seq_); }

  virtual PyObject* value() const = 0;
  virtual SwigPyIterator* incr(std::size_t n = 1) = 0;
  virtual SwigPyIterator* decr(std::size_t /*n*/ = 1) { throw stop_iteration(); }
  virtual std::ptrdiff_t distance(const SwigPyIterator& /*x*/) const {
    throw std::invalid_argument("operation not supported");
  }
  virtual bool equal(const SwigPyIterator& /*x*/) const { throw std::invalid_argument("operation not supported"); }
  virtual SwigPyIterator* copy() const = 0;

  PyObject* next() {
    PyObject* v = value();
    try {
      incr();
    } catch (...) {
      Py_XDECREF(v);
      throw;
    }
    return v;
  }
  PyObject* previous() {
    decr();
    return value();
  }
  SwigPyIterator* advance(std::ptrdiff_t n) {
    return n > 0 ? incr(static_cast<std::size_t>(n)) : decr(static_cast<std::size_t>(-n));
  }

 protected:
  // `seq` is the container's script object, or null; one reference is taken.
  explicit SwigPyIterator(PyObject* seq) : seq_(seq) { Py_XINCREF(seq_); }
  SwigPyIterator(const SwigPyIterator& other) : seq_(other.seq_) { Py_XINCREF(seq_); }
  SwigPyIterator& operator=(const SwigPyIterator&) = delete;

  PyObject* seq_;
};

// The conversion of one element to a script object.
template <class T>
struct from_oper {
  PyObject* operator()(const T& v) const { return client3::ToPython(v); }
};

// The position within a vector. Iterators over the same position type compare and subtract; any
// other pairing is refused with "bad iterator type".
template <class OutIter>
class SwigPyIterator_T : public SwigPyIterator {
 public:
  using out_iterator = OutIter;

  const out_iterator& get_current() const { return current; }

  bool equal(const SwigPyIterator& x) const override {
    if (auto* other = dynamic_cast<const SwigPyIterator_T*>(&x)) return current == other->current;
    throw std::invalid_argument("bad iterator type");
  }
  std::ptrdiff_t distance(const SwigPyIterator& x) const override {
    if (auto* other = dynamic_cast<const SwigPyIterator_T*>(&x)) return std::distance(current, other->current);
    throw std::invalid_argument("bad iterator type");
  }

 protected:
  SwigPyIterator_T(out_iterator pos, PyObject* seq) : SwigPyIterator(seq), current(pos) {}
  out_iterator current;
};

// The vector an open iterator was made on. Open iterators do not keep it alive, but while it is,
// a position outside its current elements is refused instead of being read.
template <class Seq, class OutIter>
struct Extent {
  Seq* seq = nullptr;
  bool holds(const OutIter& at) const {
    if (!seq) return true;
    OutIter first, last;
    if constexpr (std::is_same_v<OutIter, typename Seq::iterator>) {
      first = seq->begin();
      last = seq->end();
    } else {
      first = seq->rbegin();
      last = seq->rend();
    }
    auto offset = at - first;
    return offset >= 0 && offset < last - first;
  }
};

template <class OutIter, class ValueType, class FromOper = from_oper<ValueType>, class Seq = std::vector<ValueType>>
class SwigPyForwardIteratorOpen_T : public SwigPyIterator_T<OutIter> {
 public:
  using base = SwigPyIterator_T<OutIter>;
  using Range = Extent<Seq, OutIter>;

  SwigPyForwardIteratorOpen_T(OutIter pos, Range range, PyObject* seq = nullptr) : base(pos, seq), range_(range) {}

  PyObject* value() const override {
    if (!range_.holds(this->current)) throw stop_iteration();
    return FromOper()(static_cast<const ValueType&>(*this->current));
  }
  SwigPyIterator* incr(std::size_t n = 1) override {
    std::advance(this->current, static_cast<std::ptrdiff_t>(n));
    return this;
  }
  SwigPyIterator* copy() const override { return new SwigPyForwardIteratorOpen_T(*this); }

 protected:
  Range range_;
};

template <class OutIter, class ValueType, class FromOper = from_oper<ValueType>, class Seq = std::vector<ValueType>>
class SwigPyIteratorOpen_T : public SwigPyForwardIteratorOpen_T<OutIter, ValueType, FromOper, Seq> {
 public:
  using base = SwigPyForwardIteratorOpen_T<OutIter, ValueType, FromOper, Seq>;
  using base::base;

  SwigPyIterator* decr(std::size_t n = 1) override {
    std::advance(this->current, -static_cast<std::ptrdiff_t>(n));
    return this;
  }
  SwigPyIterator* copy() const override { return new SwigPyIteratorOpen_T(*this); }
};

template <class OutIter, class ValueType, class FromOper = from_oper<ValueType>, class Seq = std::vector<ValueType>>
class SwigPyForwardIteratorClosed_T : public SwigPyIterator_T<OutIter> {
 public:
  using base = SwigPyIterator_T<OutIter>;
  using Range = Extent<Seq, OutIter>;

  SwigPyForwardIteratorClosed_T(OutIter pos, OutIter first, OutIter last, Range range, PyObject* seq)
      : base(pos, seq), begin(first), end(last), range_(range) {}

  // A vector that changed size since the iterator was made is not read outside its elements.
  PyObject* value() const override {
    if (this->current == end || !range_.holds(this->current)) throw stop_iteration();
    return FromOper()(static_cast<const ValueType&>(*this->current));
  }
  SwigPyIterator* incr(std::size_t n = 1) override {
    while (n--) {
      if (this->current == end) throw stop_iteration();
      ++this->current;
    }
    return this;
  }
  SwigPyIterator* copy() const override { return new SwigPyForwardIteratorClosed_T(*this); }

 protected:
  OutIter begin, end;
  Range range_;
};

template <class OutIter, class ValueType, class FromOper = from_oper<ValueType>, class Seq = std::vector<ValueType>>
class SwigPyIteratorClosed_T : public SwigPyForwardIteratorClosed_T<OutIter, ValueType, FromOper, Seq> {
 public:
  using base = SwigPyForwardIteratorClosed_T<OutIter, ValueType, FromOper, Seq>;
  using base::base;

  SwigPyIterator* decr(std::size_t n = 1) override {
    while (n--) {
      if (this->current == this->begin) throw stop_iteration();
      --this->current;
    }
    return this;
  }
  SwigPyIterator* copy() const override { return new SwigPyIteratorClosed_T(*this); }
};

}  // namespace swig
