#pragma once

#include "history/database.h"
