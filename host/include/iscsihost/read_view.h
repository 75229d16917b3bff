/// Reading the state at one moment.
#pragma once

#include <iscsihost/host.h>

namespace iscsihost {

/// What this thread reads of the state while one lives is the state of one moment; reading much takes a good deal less,
/// too. Nothing may be changed meanwhile, nor processes forked. Where it fails, each thing is read as it is by then.
class ISCSI_HOST_API ReadView {
public:
    ReadView();
    ~ReadView();
    ReadView(const ReadView &) = delete;
    ReadView &operator=(const ReadView &) = delete;

private:
    bool open;
};

} // namespace iscsihost
