// Pickling and copying: a document is its text and filename, and, while the
// text does not read, the text its names come from (the baseline). Loading
// reads them again, so a pickle cannot hand the document logicals or rows
// that disagree with its text.
#include "common/messages.hpp"
#include "common/pycompat.hpp"
#include "pysource/scopedocument/document.hpp"

#include <memory>

namespace sdoc {

// The baseline's text: the current one with the damage put back.
py::Ref baselineText(Document& d) {
    std::vector<uint32_t> chars;
    size_t at = 0;
    for (const DamageRange& r : d.damage.ranges) {
        d.text.copyOut(at, r.start, chars);
        chars.insert(chars.end(), r.baselineMiddle.begin(), r.baselineMiddle.end());
        at = r.end;
    }
    d.text.copyOut(at, d.text.size(), chars);
    return py::check(compat::strFromWidth(chars.data(), 4, static_cast<Py_ssize_t>(chars.size())));
}

py::Ref reduceDocument(PyObject* self, Document& d) {
    py::Ref state = d.readable ? py::Ref::none() : baselineText(d);
    return py::check(Py_BuildValue("(O(OO)O)", reinterpret_cast<PyObject*>(Py_TYPE(self)), wholeText(d),
                                   d.filename.get(), state.get()));
}

void restoreDocument(PyObject* self, PyObject* state) {
    if (state == Py_None) return;
    if (!compat::isStr(state)) {
        PyErr_Format(PyExc_TypeError, "a document's state is the baseline text (str) or None, not %.200s",
                     Py_TYPE(state)->tp_name);
        py::fail();
    }
    Document& d = documentOf(self);
    py::Ref current = py::Ref::own(wholeText(d));
    auto fresh = std::make_unique<Document>();
    openDocument(*fresh, state, d.filename.get());
    if (!fresh->readable) msg::raise(PyExc_ValueError, "a document's baseline text must read");
    setText(*fresh, current.get());
    if (d.busy) msg::raise(PyExc_RuntimeError, "the document is being edited (a call came back into it)");
    auto* o = reinterpret_cast<DocumentObject*>(self);
    Document* old = o->doc;
    o->doc = fresh.release();
    delete old;
}

}  // namespace sdoc
