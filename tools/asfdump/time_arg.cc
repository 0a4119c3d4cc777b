#include "time_arg.h"

#include <cerrno>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace asfdump {
namespace {

// Reads a non-negative decimal number ("12", "2.5") at *p; advances *p past it.
bool read_number(const char** p, double* v) {
    const char* s = *p;
    if (!((*s >= '0' && *s <= '9') || *s == '.')) return false;
    char* end = nullptr;
    errno = 0;
    *v = std::strtod(s, &end);
    if (end == s || errno != 0 || !std::isfinite(*v)) return false;
    // Digits and one point only: strtod also takes exponents and hex ("1e3", "0x10").
    if (static_cast<size_t>(end - s) != std::strspn(s, "0123456789.")) return false;
    *p = end;
    return true;
}

bool to_us(double seconds, bool negative, int64_t* us) {
    double v = std::round(seconds * 1e6);
    if (v > 9.2e18) return false;  // beyond what int64 holds
    *us = negative ? -static_cast<int64_t>(v) : static_cast<int64_t>(v);
    return true;
}

// "1h2m3.5s", "500ms", "30s": number-unit pairs, each unit at most once, in order.
bool parse_units(const char* s, double* seconds) {
    static constexpr struct { const char* unit; double scale; } kUnits[] = {
        {"h", 3600.0}, {"ms", 1e-3}, {"us", 1e-6}, {"m", 60.0}, {"s", 1.0}};
    double total = 0;
    int last_rank = -1;
    int rank_of[] = {0, 3, 4, 1, 2};  // order of units within one time: h, m, s, ms, us
    while (*s) {
        double v;
        if (!read_number(&s, &v)) return false;
        int found = -1;
        for (int i = 0; i < 5; ++i) {
            size_t n = std::strlen(kUnits[i].unit);
            if (std::strncmp(s, kUnits[i].unit, n) == 0) { found = i; s += n; break; }
        }
        if (found < 0 || rank_of[found] <= last_rank) return false;
        last_rank = rank_of[found];
        total += v * kUnits[found].scale;
    }
    *seconds = total;
    return last_rank >= 0;
}

// "1:02.5" (m:ss) or "1:02:03.5" (h:mm:ss).
bool parse_clock(const char* s, double* seconds) {
    double parts[3];
    int n = 0;
    for (;;) {
        if (n == 3 || !read_number(&s, &parts[n])) return false;
        ++n;
        if (*s == '\0') break;
        if (*s != ':') return false;
        ++s;
    }
    if (n < 2) return false;
    double total = 0;
    for (int i = 0; i < n; ++i) {
        if (i > 0 && parts[i] >= 60) return false;
        if (i < n - 1 && parts[i] != std::floor(parts[i])) return false;
        total = total * 60 + parts[i];
    }
    *seconds = total;
    return true;
}

}  // namespace

bool parse_time_us(const char* text, int64_t* us) {
    if (text == nullptr || *text == '\0') return false;
    bool negative = *text == '-';
    const char* s = negative ? text + 1 : text;
    if (*s == '\0') return false;
    if (std::strspn(s, "0123456789") == std::strlen(s)) {  // plain microseconds
        char* end = nullptr;
        errno = 0;
        long long v = std::strtoll(s, &end, 10);
        if (errno != 0) return false;
        *us = negative ? -v : v;
        return true;
    }
    double seconds;
    if (std::strchr(s, ':') ? !parse_clock(s, &seconds) : !parse_units(s, &seconds)) return false;
    return to_us(seconds, negative, us);
}

std::string format_time_us(int64_t us) {
    bool negative = us < 0;
    uint64_t v = negative ? 0 - static_cast<uint64_t>(us) : static_cast<uint64_t>(us);
    uint64_t ms = (v + 500) / 1000;
    char buf[48];
    std::snprintf(buf, sizeof buf, "%s%llu:%02llu:%02llu.%03llu", negative && ms > 0 ? "-" : "",
                  static_cast<unsigned long long>(ms / 3600000),
                  static_cast<unsigned long long>(ms / 60000 % 60),
                  static_cast<unsigned long long>(ms / 1000 % 60),
                  static_cast<unsigned long long>(ms % 1000));
    return buf;
}

}  // namespace asfdump
