# The documents as the generated pages need them: headings without backticks; links to headers and to
# the cookbook's programs lead to their pages, those to other files of the tree become their text.
/^#/s/`//g
s#\[`([a-z_]+\.h)`\]\((\.\./)?include/[^)]*\)#@ref \1 "\1"#g
s#\[([^]]*)\]\((\.\./)?(examples|include|scripts|src|tests|bench|fuzz)(/[^)]*)?\)#\1#g
s#\[([^]]*)\]\([a-z]+\.dot\)#\1#g
# The page of operations is a table of links.
/^# Operations/,$s#`([A-Za-z]+(::[A-Za-z]+)?)`#@ref KeloDRCore::\1 "\1"#g
