# Links of the documents as the generated pages need them, which are three directories further down:
# headers have pages of their own, other files of the tree are linked where they are.
s#\[`([a-z_]+\.h)`\]\((\.\./)?include/[^)]*\)#@ref \1 "\1"#g
s#\]\((\.\./)?((examples|include|scripts|src|tests|bench|fuzz)[/)])#](../../../\2#g
s#\]\(([a-z]+\.dot)\)#](../../../docs/\1)#g
