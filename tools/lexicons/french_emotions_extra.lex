# French negation words and intensifiers that the polarity lexicon lacks, written for
# this project (mkbdb's lexicon format: the emotion label is the base form of a record
# of class "unkonwn"). They replace the lexicon's label of the same word. "ne" and "n'"
# are not negations here: they come with "pas", "jamais", "rien"..., and a negation
# counted twice would turn the emotion around again.
pas	unkonwn=negation
jamais	unkonwn=negation
rien	unkonwn=negation
aucun	unkonwn=negation
aucune	unkonwn=negation
nullement	unkonwn=negation
guère	unkonwn=negation
ni	unkonwn=negation
non	unkonwn=negation
sans	unkonwn=negation
extrêmement	unkonwn=strong adverb
incroyablement	unkonwn=strong adverb
vachement	unkonwn=strong adverb
