/// The lock under which daemons are changed, and the mark that says they may differ from the store.
///
/// Order of every change: take the lock, begin the transaction, change rows, mark, change the
/// daemons, commit, clear the mark. Whoever takes the lock and finds the mark reconciles first: that
/// mends what a killed process left half done.
#pragma once

#include "host/core/Lock.h"

namespace norvhost {

class ServiceLock {
public:
    int take() { return lock.take("service"); }
    /// Does not wait: 0 also when another holds it, which held() tells.
    int tryTake() { return lock.tryTake("service"); }
    bool held() const { return lock.held(); }

    int mark() const;
    void clear() const;

private:
    NamedLock lock;
};

bool daemonsMarked();

} // namespace norvhost
