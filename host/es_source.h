// Stand-in for the host's elementary-stream source (es_cbio_s): it serves
// the bytes of a RawInput, lets tests flag the end of the data, and records
// the flushes the plug-in asks for.
#pragma once

#include <cstddef>
#include <vector>

#include "es_cbio.h"
#include "raw_input.h"

namespace host {

class EsSource {
public:
    // Hooks itself into `input` as its parent; the input must outlive it.
    explicit EsSource(RawInput& input);
    EsSource(const EsSource&) = delete;
    EsSource& operator=(const EsSource&) = delete;

    es_cbio_st* cbio() { return &holder_.src; }
    void set_data_end(bool end) { holder_.src.es_is_data_end = end ? 1 : 0; }
    bool data_end() const { return holder_.src.es_is_data_end != 0; }

    size_t peek_calls = 0;
    // First argument of every peek and flush, to check which object came.
    std::vector<const void*> peek_objects;
    std::vector<const void*> flush_objects;
    std::vector<es_data_type_et> flush_types;

private:
    static size_t op_peek(void* obj, void* dst, size_t len);
    static void op_flush(void* obj, es_data_type_et type);
    static EsSource* of_source(void* obj);

    struct Holder {
        es_cbio_st src;
        EsSource* owner;
    };
    Holder holder_{};
    RawInput& input_;
};

}  // namespace host
