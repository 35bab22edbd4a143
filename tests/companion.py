"""A minimal stand-in for the companion script module: one class per wrapped class, registered through
its `_swigregister` function, destroyed by its `delete_` function, initialised through `new_` and `_swiginit`."""
import contextlib

import _Client3

classes = {}


def _make_class(name):
    namespace = {}
    if hasattr(_Client3, "delete_" + name):
        namespace["__swig_destroy__"] = getattr(_Client3, "delete_" + name)
    if hasattr(_Client3, "new_" + name):
        new, init = getattr(_Client3, "new_" + name), getattr(_Client3, name + "_swiginit")
        namespace["__init__"] = lambda self, *args: init(self, new(*args))
    return type(name, (object,), namespace)


def register():
    """Registers a class for every `_swigregister` function the module has (once)."""
    for attribute in dir(_Client3):
        if attribute.endswith("_swigregister"):
            name = attribute[: -len("_swigregister")]
            if name not in classes:
                classes[name] = _make_class(name)
                getattr(_Client3, attribute)(classes[name])
    return classes


@contextlib.contextmanager
def package_classes():
    """The Client3 package's classes registered for the block; these stand-ins put back after it."""
    import Client3

    Client3.register()
    try:
        yield
    finally:
        for name, cls in register().items():
            getattr(_Client3, name + "_swigregister")(cls)
