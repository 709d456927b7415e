// A locale in which numbers are not plain.

#ifndef KELODRCORE_TESTS_UNIT_GROUPING_LOCALE_H_
#define KELODRCORE_TESTS_UNIT_GROUPING_LOCALE_H_

#include <clocale>
#include <locale>
#include <string>

// While it lives, streams write 1234567 as 1.234.567, and C sees the user's locale.
class GroupingLocale {
 public:
  GroupingLocale()
      : before(std::locale::global(std::locale(std::locale::classic(), new Grouping))) {
    std::setlocale(LC_ALL, "");
  }
  GroupingLocale(const GroupingLocale&) = delete;
  GroupingLocale& operator=(const GroupingLocale&) = delete;
  ~GroupingLocale() {
    std::locale::global(before);
    std::setlocale(LC_ALL, "C");
  }

 private:
  struct Grouping : std::numpunct<char> {
    char do_thousands_sep() const override { return '.'; }
    std::string do_grouping() const override { return "\3"; }
  };

  std::locale before;
};

#endif  // KELODRCORE_TESTS_UNIT_GROUPING_LOCALE_H_
