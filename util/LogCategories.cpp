#include "util/LogCategories.h"

namespace tamblo {

namespace log_categories {

constinit const LogCategory client("zrrc");
constinit const LogCategory serviceDelegate("zrrs");
constinit const LogCategory session("zrrr");
constinit const LogCategory sessionLinkmeter("zrri");
constinit const LogCategory driverUtility("zrrd");
constinit const LogCategory trace("zrrt");
constinit const LogCategory joulery("zrrp");
constinit const LogCategory qmx("zrra");
constinit const LogCategory zeph("zrrb");
constinit const LogCategory summary("zrru");
constinit const LogCategory dp("zrrl");
constinit const LogCategory audioRegistration("zrrz");

} // namespace log_categories

void forgetLogThresholds() noexcept {
    using namespace log_categories;
    for (const LogCategory* category :
         {&client, &serviceDelegate, &session, &sessionLinkmeter, &driverUtility, &trace, &joulery, &qmx,
          &zeph, &summary, &dp, &audioRegistration}) {
        category->forgetThreshold();
    }
}

} // namespace tamblo
