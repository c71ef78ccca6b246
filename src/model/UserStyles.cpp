#include "model/UserStyles.h"

#include "color/WorkingOrder.h"

namespace vora {

int AddUserStyle(const IImage* style) {
    // The converted matrix is dropped at once: user styles are not stored yet,
    // and ranking never sees them.
    ToWorkingOrder(style);
    return 0;
}

}  // namespace vora
