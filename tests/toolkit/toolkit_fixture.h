// What the toolkit tests share: the builders, the reference host and its inputs,
// and a common demuxer state wired to the host's callbacks. Every test built on
// it ends by checking that the host holds no block of the toolkit.
#pragma once

#include <gtest/gtest.h>

#include <memory>

#include "callbacks.h"
#include "raw_input.h"
#include "streaming.h"
#include "sys_demuxer.h"
#include "sys_output.h"
#include "test_env.h"
#include "toolkit_builders.h"

class HostedToolkit : public ::testing::Test {
protected:
    HostedToolkit() { d.callback = *host.table(); }
    void TearDown() override {
        EXPECT_EQ(host.outstanding_blocks(), 0u) << "the host still holds toolkit blocks";
        EXPECT_EQ(host.foreign_frees(), 0u);
    }
    template <typename T> void release(T*& p) { sys_free(&d, p); }

    host::HostCallbacks host;
    sys_demuxer_st d{};
};
