#include "server/browser/BrowserService.h"
