#include "es_source.h"

namespace host {

EsSource::EsSource(RawInput& input) : input_(input) {
    holder_.owner = this;
    holder_.src.peek = &EsSource::op_peek;
    holder_.src.flush = &EsSource::op_flush;
    input.io()->parent = &holder_.src;
}

EsSource* EsSource::of_source(void* obj) {
    return reinterpret_cast<Holder*>(obj)->owner;
}

// The reader hands peek its raw input; the source is that input's parent.
size_t EsSource::op_peek(void* obj, void* dst, size_t len) {
    cb_io_st* io = static_cast<cb_io_st*>(obj);
    EsSource* self = of_source(io->parent);
    self->peek_calls++;
    self->peek_objects.push_back(obj);
    return self->input_.peek(dst, len);
}

void EsSource::op_flush(void* obj, es_data_type_et type) {
    EsSource* self = of_source(obj);
    self->flush_objects.push_back(obj);
    self->flush_types.push_back(type);
}

}  // namespace host
