// The client's todo-state changes: every transfer, install and coordination step records its
// outcome in the host's todo list through here.
#include "client/apps_client.h"

namespace appsync {

void AppsClient::changeAssetID(const std::string& assetID, const std::string& toDo) {
  todoList_.changeAssetID(assetID, toDo);
}

}  // namespace appsync
