#include "tools/docuvendctl/GrantList.h"

namespace docuvend::ctl {

List listOf(const std::vector<Grant>& grants) {
  List list{{"provider", "item", "consumer"}, {}};
  for (const Grant& grant : grants) list.rows.push_back({grant.provider.value, grant.item.value, grant.consumer.value});
  return list;
}

}  // namespace docuvend::ctl
