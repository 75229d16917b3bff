#include "iscsihost/read_view.h"

#include "host/state/Database.h"

namespace iscsihost {

using norvhost::Query;

ReadView::ReadView() : open(Query("BEGIN").run() == 0) {}

ReadView::~ReadView()
{
    if (open)
        Query("COMMIT").run();
}

} // namespace iscsihost
