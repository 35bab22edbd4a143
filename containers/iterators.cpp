// The module functions of the iterator objects.
#include <cstddef>
#include <memory>
#include <stdexcept>

#include "containers/dispatch.h"
#include "containers/iterators.h"
#include "runtime/wrap.h"

namespace client3 {

namespace {

using swig::SwigPyIterator;

// Stepping past a closed iterator's bounds: StopIteration with None as its value. Relating
// iterators of different kinds: ValueError.
void SteppingErrors() {
  try {
    throw;
  } catch (const swig::stop_iteration&) {
    Py_INCREF(Py_None);
    SetErrorObj(PyExc_StopIteration, Py_None);
  } catch (const std::invalid_argument& error) {
    PyErr_SetString(PyExc_ValueError, error.what());
  }
}

// distance and equal raise the native exception itself, as an owned proxy of its type.
void RelationErrors() {
  try {
    throw;
  } catch (const std::invalid_argument& error) {
    TypeInfo* type = TypeFor<std::invalid_argument>();
    SetErrorObj(ExceptionType(type), NewPointerObj(nullptr, new std::invalid_argument(error), type, PointerOwn));
  }
}

using Self = client3::Self<SwigPyIterator>;
using ConstSelf = client3::ConstSelf<SwigPyIterator>;
using Disowned = client3::Disowned<SwigPyIterator>;
using Other = Pointer<const SwigPyIterator, "swig::SwigPyIterator const &">;
using Steps = ScalarKind<unsigned int, "size_t", AsUnsignedInt>;
using Offset = ScalarKind<int, "ptrdiff_t", AsInt>;

// The iterator of an in-place addition. Its proxy gives up ownership once the move succeeded,
// and the result claims it.
struct InPlace {
  SwigPyIterator* it;
  PyObject* object;
};
struct InPlaceSelf : Self {
  PyObject* object = nullptr;
  int load(PyObject* o) {
    object = o;
    return Self::load(o);
  }
  InPlace get() const { return {value, object}; }
};

Owned<SwigPyIterator> Moved(InPlace s, std::ptrdiff_t n) {
  s.it->advance(n);
  void* pointer;
  ConvertPtr(s.object, &pointer, TypeFor<SwigPyIterator>(), PointerDisown);
  return {s.it};
}

// A copy moved by n; the copy is freed if the move stops.
Owned<SwigPyIterator> Shifted(const SwigPyIterator* it, std::ptrdiff_t n) {
  std::unique_ptr<SwigPyIterator> moved(it->copy());
  moved->advance(n);
  return {moved.release()};
}

PyObject* Distance(std::ptrdiff_t steps) { return PyLong_FromSsize_t(steps); }

constexpr auto value = [](const SwigPyIterator* it) { return it->value(); };
constexpr auto incr = [](SwigPyIterator* it) { return Borrowed<SwigPyIterator>{it->incr()}; };
constexpr auto incrBy = [](SwigPyIterator* it, unsigned int n) { return Borrowed<SwigPyIterator>{it->incr(n)}; };
constexpr auto decr = [](SwigPyIterator* it) { return Borrowed<SwigPyIterator>{it->decr()}; };
constexpr auto decrBy = [](SwigPyIterator* it, unsigned int n) { return Borrowed<SwigPyIterator>{it->decr(n)}; };
constexpr auto distance = [](const SwigPyIterator* it, const SwigPyIterator* x) { return Distance(it->distance(*x)); };
constexpr auto equal = [](const SwigPyIterator* it, const SwigPyIterator* x) { return it->equal(*x); };
constexpr auto notEqual = [](const SwigPyIterator* it, const SwigPyIterator* x) { return !it->equal(*x); };
constexpr auto copy = [](const SwigPyIterator* it) { return Owned<SwigPyIterator>{it->copy()}; };
constexpr auto next = [](SwigPyIterator* it) { return it->next(); };
constexpr auto previous = [](SwigPyIterator* it) { return it->previous(); };
constexpr auto advance = [](SwigPyIterator* it, int n) { return Borrowed<SwigPyIterator>{it->advance(n)}; };
constexpr auto iadd = [](InPlace s, int n) { return Moved(s, n); };
constexpr auto isub = [](InPlace s, int n) { return Moved(s, -static_cast<std::ptrdiff_t>(n)); };
constexpr auto add = [](const SwigPyIterator* it, int n) { return Shifted(it, n); };
constexpr auto sub = [](const SwigPyIterator* it, int n) { return Shifted(it, -static_cast<std::ptrdiff_t>(n)); };
constexpr auto between = [](const SwigPyIterator* it, const SwigPyIterator* x) { return Distance(x->distance(*it)); };

template <auto Target>
constexpr auto Step = Guarded<Target, SteppingErrors>;
template <auto Target>
constexpr auto Relate = Guarded<Target, RelationErrors>;

constexpr Text kIncr = "SwigPyIterator_incr";
constexpr Text kDecr = "SwigPyIterator_decr";

using Functions = Table<
    Fn<"delete_SwigPyIterator", Object, Delete<SwigPyIterator>, Disowned>,
    Fn<"SwigPyIterator_value", Object, Step<value>, ConstSelf>,
    Overloaded<kIncr, OverloadMessage<kIncr, Text{"swig::SwigPyIterator::incr(size_t)"}, Text{"swig::SwigPyIterator::incr()"}>,
               Form<Step<incrBy>, Self, Steps>, Form<Step<incr>, Self>>,
    Overloaded<kDecr, OverloadMessage<kDecr, Text{"swig::SwigPyIterator::decr(size_t)"}, Text{"swig::SwigPyIterator::decr()"}>,
               Form<Step<decrBy>, Self, Steps>, Form<Step<decr>, Self>>,
    Fn<"SwigPyIterator_distance", Tuple, Relate<distance>, ConstSelf, Other>,
    Fn<"SwigPyIterator_equal", Tuple, Relate<equal>, ConstSelf, Other>,
    Fn<"SwigPyIterator_copy", Object, copy, ConstSelf>,
    Fn<"SwigPyIterator_next", Object, Step<next>, Self>,
    Fn<"SwigPyIterator___next__", Object, Step<next>, Self>,
    Fn<"SwigPyIterator_previous", Object, Step<previous>, Self>,
    Fn<"SwigPyIterator_advance", Tuple, Step<advance>, Self, Offset>,
    OperatorLine<"SwigPyIterator___eq__", Form<Step<equal>, ConstSelf, Other>>,
    OperatorLine<"SwigPyIterator___ne__", Form<Step<notEqual>, ConstSelf, Other>>,
    Fn<"SwigPyIterator___iadd__", Tuple, Step<iadd>, InPlaceSelf, Offset>,
    Fn<"SwigPyIterator___isub__", Tuple, Step<isub>, InPlaceSelf, Offset>,
    OperatorLine<"SwigPyIterator___add__", Form<Step<add>, ConstSelf, Offset>>,
    OperatorLine<"SwigPyIterator___sub__", Form<Step<sub>, ConstSelf, Offset>, Form<Step<between>, ConstSelf, Other>>,
    Register<"SwigPyIterator", p_SwigPyIterator>>;

}  // namespace

std::span<const PyMethodDef> IteratorFunctions() { return Functions::defs; }

}  // namespace client3
