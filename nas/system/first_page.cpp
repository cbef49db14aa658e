#include "nas/system/first_page.h"

#include <utility>

namespace nas {
namespace {

FirstPage g_page;

}  // namespace

void ExpectFirstPage(FirstPage page) { g_page = std::move(page); }
const FirstPage& ExpectedFirstPage() { return g_page; }

}  // namespace nas
